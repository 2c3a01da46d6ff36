#!/usr/bin/env bash
# Set-up, build and run. Usage: ./run.sh demo | ./run.sh test [--asan|--tsan [CTEST_ARGS...]] |
# ./run.sh test --windows | ./run.sh bench | ./run.sh fuzz [SECONDS]
set -euo pipefail
cd "$(dirname "$0")"

# cpp-httplib: the simulated camera; libmicrohttpd: quenvar-host serve;
# python3: the Digest server the tests check answers against.
PACKAGES=(cmake ninja-build g++ pkg-config ccache openssl qt6-base-dev libgtest-dev libgmock-dev
    libcpp-httplib-dev libssl-dev rapidjson-dev libhttp-parser-dev libmicrohttpd-dev python3)
# The demo reads the event stream with curl and formats JSON with jq.
DEMO_PACKAGES=(curl jq)
# Benchmarks: Google Benchmark, and the peers they are measured against.
BENCH_PACKAGES=(libbenchmark-dev nginx-light wrk python3)
# AddressSanitizer builds and fuzzing: clang, its sanitizer runtimes, llvm-symbolizer for traces.
CLANG_PACKAGES=(clang libclang-rt-14-dev llvm)
# The logging library's Windows code: the MinGW-w64 cross compiler and Wine to run what it built.
WINDOWS_PACKAGES=(cmake ninja-build ccache g++-mingw-w64-x86-64-posix wine64)

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
    case "${2:-}" in
    "")
        ensure_packages "${PACKAGES[@]}"
        build build Debug
        (cd build && ctest --output-on-failure --timeout 300 -j"$(nproc)")
        ;;
    --asan)
        ensure_packages "${PACKAGES[@]}" "${CLANG_PACKAGES[@]}"
        flags="-fsanitize=address,undefined -fno-sanitize-recover=undefined -fno-omit-frame-pointer"
        build build-asan Debug -DCMAKE_CXX_COMPILER=clang++ "-DCMAKE_CXX_FLAGS=$flags"
        (cd build-asan && ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 \
            ctest --output-on-failure --timeout 300 -j"$(nproc)" "${@:3}")
        ;;
    --tsan)
        # GCC's ThreadSanitizer: clang 14's aborts as soon as Qt starts a child process.
        ensure_packages "${PACKAGES[@]}"
        build build-tsan Debug -DCMAKE_CXX_COMPILER=g++ \
            "-DCMAKE_CXX_FLAGS=-fsanitize=thread -fno-omit-frame-pointer"
        suppressions="$PWD/tests/tsan.supp"
        (cd build-tsan && TSAN_OPTIONS="suppressions=$suppressions" \
            ctest --output-on-failure --timeout 300 -j"$(nproc)" "${@:3}")
        ;;
    --windows)
        ensure_packages "${WINDOWS_PACKAGES[@]}"
        tests/windows/windows.sh build-windows
        ;;
    *)
        echo "usage: $0 test [--asan|--tsan [CTEST_ARGS...]|--windows]" >&2
        exit 2
        ;;
    esac
    ;;
bench)
    ensure_packages "${PACKAGES[@]}" "${BENCH_PACKAGES[@]}"
    build build-bench Release -DQUENVAR_BUILD_BENCH=ON -DQUENVAR_BUILD_TESTS=OFF \
        -DQUENVAR_BUILD_TOOLS=OFF
    bench/run_bench.py build-bench
    ;;
fuzz)
    ensure_packages "${PACKAGES[@]}" "${CLANG_PACKAGES[@]}"
    tests/fuzz/fuzz.sh build-fuzz "${2:-60}"
    ;;
*)
    echo "usage: $0 demo|test|bench|fuzz" >&2
    exit 2
    ;;
esac
