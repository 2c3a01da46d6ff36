#!/usr/bin/env bash
# Set-up, build and run. Usage: ./run.sh demo | ./run.sh test | ./run.sh bench
set -euo pipefail
cd "$(dirname "$0")"

PACKAGES=(cmake ninja-build g++ pkg-config ccache openssl qt6-base-dev libgtest-dev libgmock-dev
    libcpp-httplib-dev libssl-dev)
# The demo reads the event stream with curl and formats JSON with jq.
DEMO_PACKAGES=(curl jq)
# Benchmarks: Google Benchmark, and the peers they are measured against.
BENCH_PACKAGES=(libbenchmark-dev nginx-light wrk python3)

as_root() {
    if [ "$(id -u)" -eq 0 ]; then "$@"; else sudo "$@"; fi
}

# Installs the Debian packages that are not there yet; a second run does nothing.
ensure_packages() {
    local missing=()
    for package in "$@"; do
        dpkg-query -W -f='${Status}' "$package" 2>/dev/null | grep -q "install ok installed" ||
            missing+=("$package")
    done
    if [ ${#missing[@]} -gt 0 ]; then
        echo "installing: ${missing[*]}"
        as_root apt-get update -qq
        as_root env DEBIAN_FRONTEND=noninteractive \
            apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
    fi
}

# build DIR BUILD_TYPE [cmake options...]
build() {
    local dir=$1 type=$2
    shift 2
    cmake -S . -B "$dir" -G Ninja -DCMAKE_BUILD_TYPE="$type" "$@" >/dev/null
    cmake --build "$dir" -- -j"$(nproc)"
}

command=${1:-}
case "$command" in
demo)
    ensure_packages "${PACKAGES[@]}" "${DEMO_PACKAGES[@]}"
    build build Debug
    tools/demo/demo.sh build
    ;;
test)
    ensure_packages "${PACKAGES[@]}"
    build build Debug
    (cd build && ctest --output-on-failure --timeout 300 -j"$(nproc)")
    ;;
bench)
    ensure_packages "${PACKAGES[@]}" "${BENCH_PACKAGES[@]}"
    build build-bench Release -DQUENVAR_BUILD_BENCH=ON -DQUENVAR_BUILD_TESTS=OFF \
        -DQUENVAR_BUILD_TOOLS=OFF
    bench/run_bench.py build-bench
    ;;
*)
    echo "usage: $0 demo|test|bench" >&2
    exit 2
    ;;
esac
