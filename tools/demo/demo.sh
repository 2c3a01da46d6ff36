#!/usr/bin/env bash
# The plugin at work: ten client requests through quenvar-host against a simulated camera and a
# simulated VCA plugin, then the HTTP front with its token: a request, and a rule change arriving
# as an event on its stream.
# Usage: tools/demo/demo.sh [BUILD_DIR]   (run by ./run.sh demo after the build)
set -euo pipefail
cd "$(dirname "$0")/../.."

build_dir=${1:-build}
host_bin="$build_dir/bin/quenvar-host"
camsim_bin="$build_dir/bin/quenvar-camsim"
camera_user=admin
camera_pass=demo-secret
event_wait_seconds=15

work=$(mktemp -d)
pids=()

cleanup() {
    local pid
    for pid in "${pids[@]}"; do
        kill "$pid" 2>/dev/null || true
    done
    for pid in "${pids[@]}"; do
        wait "$pid" 2>/dev/null || true
    done
    rm -rf "$work"
}
trap cleanup EXIT
trap 'echo; echo "demo interrupted" >&2; exit 130' INT TERM

fail() {
    echo "demo failed: $*" >&2
    exit 1
}

# wait_for_line FILE PATTERN SECONDS: the first line of FILE matching PATTERN.
wait_for_line() {
    local file=$1 pattern=$2 tries=$(($3 * 10)) line
    while [ "$tries" -gt 0 ]; do
        line=$(grep -m1 -E "$pattern" "$file" 2>/dev/null || true)
        if [ -n "$line" ]; then
            echo "$line"
            return 0
        fi
        sleep 0.1
        tries=$((tries - 1))
    done
    return 1
}

# shorten TEXT WIDTH
shorten() {
    local text=$1 width=$2
    if [ "${#text}" -gt "$width" ]; then
        echo "${text:0:$((width - 3))}..."
    else
        echo "$text"
    fi
}

for program in "$host_bin" "$camsim_bin"; do
    [ -x "$program" ] || fail "$program is missing; build first (./run.sh demo does)"
done

"$camsim_bin" --listen 127.0.0.1:0 --auth digest --user "$camera_user" --pass "$camera_pass" \
    --log "$work/camera-requests.log" >"$work/camsim.out" 2>"$work/camsim.err" &
pids+=($!)
camera_url=$(wait_for_line "$work/camsim.out" '^listening on ' 10) ||
    fail "the simulated camera did not start: $(cat "$work/camsim.err")"
camera_url=${camera_url#listening on }
camera_port=${camera_url##*:}

cp -r tools/demo/vca "$work/vca"

echo "Simulated camera: $camera_url (Digest authentication, user $camera_user)"
echo "Simulated VCA plugin's folder: $work/vca"
echo

camera="\"host\":\"127.0.0.1\",\"port\":$camera_port,\"user\":\"$camera_user\",\"pass\":\"$camera_pass\",\"useSSL\":false"
commands=(
    retrieveVcaRawRuleInfo '"cam1"'
    getRecordingVCARule '{"locationIDs":["lobby","gate"],"timestamp":1700000000}'
    retrievePTZIdleAction "{$camera}"
    setPTZIdleAction "{$camera,\"enabled\":1,\"interval\":45}"
    retrievePTZTrackingType "{$camera,\"nodeID\":\"node-7\"}"
    setPTZTrackingType "{$camera,\"type\":\"smarttracking\"}"
    stopPTZMovement "{$camera}"
    areaZoom "{$camera,\"zoomCenterX\":480,\"zoomCenterY\":270,\"viewCellWidth\":960,\"viewCellHeight\":540,\"resolutionWidth\":1920,\"resolutionHeight\":1080,\"zoomRatio\":2}"
    gotoSmartTrackingAdvPreset "{$camera,\"presetName\":\"Entrance\"}"
    getSmartTrackingAdvPresetList "{$camera}"
)

row_format="%-29s %-34s %-5s %s\n"
printf "$row_format" COMMAND "PARAMETERS (without the camera's)" CODE PAYLOAD
printf "$row_format" "$(printf '%.0s-' {1..29})" "$(printf '%.0s-' {1..34})" "-----" "$(printf '%.0s-' {1..56})"
succeeded=0
for ((i = 0; i < ${#commands[@]}; i += 2)); do
    command=${commands[i]}
    params=${commands[i + 1]}
    status=0
    answer=$("$host_bin" request --vca-dir "$work/vca" --timeout-ms 15000 "$command" "$params" \
        2>>"$work/host.err") || status=$?
    shown_params=$(jq -c 'if type == "object" then del(.host, .port, .user, .pass, .useSSL) else . end' <<<"$params")
    if [ "$status" -eq 0 ]; then
        code=$(jq -r '.code' <<<"$answer")
        payload=$(jq -c '.payload' <<<"$answer")
        [ "$code" = 0 ] && succeeded=$((succeeded + 1))
    else
        code="-"
        payload="(not answered: exit status $status)"
    fi
    printf "$row_format" "$command" "$(shorten "$shown_params" 34)" "$code" "$(shorten "$payload" 56)"
done
total=$((${#commands[@]} / 2))
echo
echo "$succeeded of $total commands succeeded (code 0)."
[ "$succeeded" -eq "$total" ] ||
    fail "not every command succeeded; the host's messages: $(cat "$work/host.err")"
echo

"$host_bin" serve --listen 127.0.0.1:0 --vca-dir "$work/vca" >"$work/serve.out" 2>"$work/serve.err" &
pids+=($!)
serve_url=$(wait_for_line "$work/serve.out" '^listening on ' 10) ||
    fail "quenvar-host serve did not start: $(cat "$work/serve.err")"
serve_url=${serve_url#listening on }
# Without QUENVAR_HOST_TOKEN, serve makes a token for the run and prints it as its second line.
token=$(wait_for_line "$work/serve.out" '^token: ' 10) || fail "quenvar-host serve printed no token"
token=${token#token: }
# curl reads the header from a file, so that the token stays off command lines.
auth_header="$work/auth-header"
(umask 077 && printf 'Authorization: Bearer %s\n' "$token" >"$auth_header")
echo "quenvar-host serve: $serve_url"

status=$(curl -s -o /dev/null -w '%{http_code}' "$serve_url/api/plugins")
[ "$status" = 401 ] || fail "GET /api/plugins without the token: HTTP $status, not 401"
echo "GET /api/plugins without the token: HTTP $status"
answer=$(curl -s -H @"$auth_header" -H 'Content-Type: application/json' \
    -d '{"command":"retrieveVcaRawRuleInfo","params":"cam1"}' "$serve_url/api/request")
code=$(jq -r '.code' <<<"$answer" 2>/dev/null) || code=
[ "$code" = 0 ] || fail "POST /api/request with the token: $answer"
echo "POST /api/request retrieveVcaRawRuleInfo with the token: code $code"

curl -sN -H @"$auth_header" "$serve_url/api/events?subscriber=demo" >"$work/events.txt" &
pids+=($!)
wait_for_line "$work/events.txt" '^: subscribed' 10 >/dev/null ||
    fail "could not subscribe to $serve_url/api/events"
echo "Subscribed to $serve_url/api/events?subscriber=demo"

sed -i 's/"sensitivity":80/"sensitivity":95/' "$work/vca/live/cam1.xml"
changed_at=$(date +%s%N)
echo "Changed live/cam1.xml (Front door sensitivity 80 -> 95); waiting for the event..."
wait_for_line "$work/events.txt" '^event: liveVCARuleChanged' "$event_wait_seconds" >/dev/null ||
    fail "no liveVCARuleChanged event within $event_wait_seconds s"
wait_for_line "$work/events.txt" '^data: ' 5 >/dev/null || fail "the event came without data"
elapsed_ms=$((($(date +%s%N) - changed_at) / 1000000))
echo
echo "Event received $((elapsed_ms / 1000)).$(printf '%03d' $((elapsed_ms % 1000))) s after the change:"
grep -m1 '^event: ' "$work/events.txt"
grep -m1 '^data: ' "$work/events.txt" | sed 's/^data: //' | jq .
echo
echo "Demo finished: every command answered and the change event arrived."
