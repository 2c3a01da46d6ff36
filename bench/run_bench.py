#!/usr/bin/env python3
"""Runs every benchmark of a release build beside its baseline and prints one summary table.

Usage: bench/run_bench.py BUILD_DIR

Raw results go to BUILD_DIR/bench-results/, the table (Markdown) also to
BUILD_DIR/bench-results/summary.md. Exit status: 0 when every target is met, 3 when a target is
missed, 1 when a benchmark could not run. Everything started here (nginx, the silent servers) is
stopped on the way out, also on failure, Ctrl-C or SIGTERM.
"""

import ctypes
import datetime
import json
import os
import platform
import re
import resource
import selectors
import signal
import socket
import subprocess
import sys
import tempfile
import threading
import time

STOP_PATH = "/cgi-bin/camctrl/camctrl.cgi?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop"
CAMERA_PORTS = 100
IN_FLIGHT = 64
# About 2 s of load, so that a moment's noise on a shared machine does not decide the ratio
# against wrk's 5 s; the Qt-only reference, some 15 times slower, runs a tenth of it.
CAMERA_OPERATIONS = 200000
MEMORY_OPERATIONS = 10000
IDLE_CAMERAS = 10000
IDLE_MS = 2000
WRK_SECONDS = 5
GBENCH_ARGS = [
    "--benchmark_repetitions=5",
    "--benchmark_enable_random_interleaving=true",
    "--benchmark_report_aggregates_only=true",
    "--benchmark_min_time=0.1",
]


class BenchError(Exception):
    pass


def die_with_parent():
    """Run in a child before exec: the kernel stops it if this script dies without cleaning up."""
    PR_SET_PDEATHSIG = 1
    ctypes.CDLL(None, use_errno=True).prctl(PR_SET_PDEATHSIG, signal.SIGTERM)


def run(command, log_path, timeout):
    """Runs a command to its end; returns its standard output. Standard error goes to the log."""
    with open(log_path, "w") as log:
        try:
            result = subprocess.run(command, stdout=subprocess.PIPE, stderr=log, text=True,
                                    timeout=timeout, preexec_fn=die_with_parent)
        except subprocess.TimeoutExpired:
            raise BenchError(f"{os.path.basename(command[0])} did not finish in {timeout} s")
    if result.returncode != 0:
        raise BenchError(f"{' '.join(command)} exited with {result.returncode}; see {log_path}")
    return result.stdout


def free_ports(count):
    sockets = []
    try:
        for _ in range(count):
            s = socket.socket()
            s.bind(("127.0.0.1", 0))
            sockets.append(s)
        return [s.getsockname()[1] for s in sockets]
    finally:
        for s in sockets:
            s.close()


def wait_listening(ports, process, seconds):
    deadline = time.monotonic() + seconds
    for port in ports:
        while True:
            if process is not None and process.poll() is not None:
                return False
            try:
                with socket.create_connection(("127.0.0.1", port), timeout=1):
                    break
            except OSError:
                if time.monotonic() > deadline:
                    return False
                time.sleep(0.05)
    return True


class Nginx:
    """nginx in the foreground, as the current user, listening on free loopback ports and
    answering the camera's stop path with a fixed body."""

    def __init__(self, folder, port_count, every_loopback_address=False):
        self.folder = folder
        self.port_count = port_count
        self.every_loopback_address = every_loopback_address
        self.process = None
        self.ports = []

    def config(self):
        folder = self.folder
        # On every address, so that each of 127.0.0.0/8 is a camera of its own; answering
        # loopback peers only.
        address = "" if self.every_loopback_address else "127.0.0.1:"
        listens = "\n".join(f"        listen {address}{port};" for port in self.ports)
        if self.every_loopback_address:
            listens += "\n        allow 127.0.0.0/8;\n        deny all;"
        return f"""worker_processes 1;
daemon off;
pid {folder}/nginx.pid;
error_log {folder}/error.log warn;
events {{ worker_connections 4096; }}
http {{
    access_log off;
    keepalive_requests 1000000;
    keepalive_timeout 60s;
    client_body_temp_path {folder}/body;
    proxy_temp_path {folder}/proxy;
    fastcgi_temp_path {folder}/fastcgi;
    uwsgi_temp_path {folder}/uwsgi;
    scgi_temp_path {folder}/scgi;
    server {{
{listens}
        location = /cgi-bin/camctrl/camctrl.cgi {{
            default_type text/plain;
            return 200 "OK\\n";
        }}
        location / {{ return 404; }}
    }}
}}
"""

    def __enter__(self):
        # A port taken by someone else between our look-up and nginx's bind: try new ones.
        for _ in range(3):
            self.ports = free_ports(self.port_count)
            path = os.path.join(self.folder, "nginx.conf")
            with open(path, "w") as conf:
                conf.write(self.config())
            log = open(os.path.join(self.folder, "stderr.log"), "w")
            self.process = subprocess.Popen(
                ["nginx", "-p", self.folder, "-c", path, "-e", os.path.join(self.folder,
                                                                            "error.log")],
                stdout=log, stderr=log, preexec_fn=die_with_parent)
            log.close()
            if wait_listening(self.ports, self.process, 10):
                return self
            self.stop()
        raise BenchError(f"nginx did not start; see {self.folder}/error.log")

    def stop(self):
        if self.process and self.process.poll() is None:
            self.process.terminate()
            try:
                self.process.wait(5)
            except subprocess.TimeoutExpired:
                self.process.kill()
                self.process.wait()
        self.process = None

    def __exit__(self, *_):
        self.stop()


class SilentServers:
    """Loopback ports that accept every connection and never answer."""

    def __init__(self, port_count):
        self.listeners = []
        self.accepted = []
        self.selector = selectors.DefaultSelector()
        self.stopping = threading.Event()
        self.thread = threading.Thread(target=self.serve, daemon=True)
        for _ in range(port_count):
            listener = socket.socket()
            listener.bind(("127.0.0.1", 0))
            listener.listen(1024)
            listener.setblocking(False)
            self.selector.register(listener, selectors.EVENT_READ)
            self.listeners.append(listener)
        self.ports = [s.getsockname()[1] for s in self.listeners]

    def serve(self):
        while not self.stopping.is_set():
            for key, _ in self.selector.select(0.2):
                try:
                    connection, _ = key.fileobj.accept()
                    self.accepted.append(connection)
                except BlockingIOError:
                    pass

    def __enter__(self):
        self.thread.start()
        return self

    def __exit__(self, *_):
        self.stopping.set()
        self.thread.join()
        for s in self.accepted + self.listeners:
            s.close()
        self.selector.close()


def google_benchmark(binary, results):
    name = os.path.basename(binary)
    out = os.path.join(results, f"{name}.json")
    run([binary, f"--benchmark_out={out}", "--benchmark_out_format=json"] + GBENCH_ARGS,
        os.path.join(results, f"{name}.log"), 600)
    with open(out) as f:
        data = json.load(f)
    medians = {}
    for entry in data["benchmarks"]:
        if entry.get("aggregate_name") == "median":
            medians[entry["run_name"]] = entry
    return medians


def nanoseconds(entry):
    scale = {"ns": 1, "us": 1e3, "ms": 1e6, "s": 1e9}[entry["time_unit"]]
    return entry["cpu_time"] * scale


def children_cpu_seconds():
    usage = resource.getrusage(resource.RUSAGE_CHILDREN)
    return usage.ru_utime + usage.ru_stime


def wrk(port, results):
    cpu_before = children_cpu_seconds()
    output = run(["wrk", "-t2", f"-c{IN_FLIGHT}", f"-d{WRK_SECONDS}s", "--latency",
                  f"http://127.0.0.1:{port}{STOP_PATH}"],
                 os.path.join(results, "wrk.log"), WRK_SECONDS + 30)
    with open(os.path.join(results, "wrk.txt"), "w") as f:
        f.write(output)
    rate = re.search(r"Requests/sec:\s*([\d.]+)", output)
    if not rate:
        raise BenchError("no Requests/sec in the output of wrk")
    unit = {"us": 1e-3, "ms": 1.0, "s": 1e3}

    def latency(percent):
        found = re.search(rf"^\s*{percent}%\s+([\d.]+)(us|ms|s)\s*$", output, re.M)
        return float(found.group(1)) * unit[found.group(2)] if found else float("nan")

    report = {"opsPerSecond": float(rate.group(1)), "p50Ms": latency(50), "p99Ms": latency(99)}
    requests = re.search(r"^\s*(\d+) requests in", output, re.M)
    if requests:
        cpu = children_cpu_seconds() - cpu_before
        report["cpuMicrosPerOp"] = cpu * 1e6 / int(requests.group(1))
    return report


def camera_load(build, ports, results, tag, qt_only=False):
    count = CAMERA_OPERATIONS // 10 if qt_only else CAMERA_OPERATIONS
    command = [os.path.join(build, "bin", "quenvar-bench-camera"),
               "--ports", ",".join(map(str, ports)), "--in-flight", str(IN_FLIGHT),
               "--count", str(count), "--warmup", str(count // 10)]
    if qt_only:
        command.append("--qt-only")
    report = json.loads(run(command, os.path.join(results, f"camera-{tag}.log"), 240))
    if report["failures"]:
        raise BenchError(f"{report['failures']} camera operations failed ({tag})")
    return report


def memory(build, ports, results, tag):
    command = [os.path.join(build, "bin", "quenvar-bench-memory"),
               "--ports", ",".join(map(str, ports)), "--count", str(MEMORY_OPERATIONS)]
    return json.loads(run(command, os.path.join(results, f"memory-{tag}.log"), 60))


def idle(build, port, results):
    command = [os.path.join(build, "bin", "quenvar-bench-idle"), "--port", str(port),
               "--cameras", str(IDLE_CAMERAS), "--in-flight", str(IN_FLIGHT),
               "--idle-ms", str(IDLE_MS)]
    return json.loads(run(command, os.path.join(results, "idle.log"), 120))


class Table:
    def __init__(self):
        self.rows = []
        self.missed = False

    def add(self, figure, value, baseline, ratio, target, met):
        if met is False:
            self.missed = True
        result = "—" if met is None else ("pass" if met else "**miss**")
        self.rows.append((figure, value, baseline, ratio, target, result))

    def markdown(self):
        lines = ["| Figure | Measured | Baseline (same run) | Ratio | Target | Result |",
                 "|---|---|---|---|---|---|"]
        lines += ["| " + " | ".join(row) + " |" for row in self.rows]
        return "\n".join(lines)


def mbps(entry):
    return f"{entry['bytes_per_second'] / 1e6:,.1f} MB/s"


def xml_rows(table, medians):
    replies = [("live-json-10", "live reply, 10 JSON rules", True),
               ("live-json-100", "live reply, 100 JSON rules", True),
               ("live-json-1000", "live reply, 1,000 JSON rules", True),
               ("recording-100", "recording reply, 100 locations", True),
               ("live-xml-10", "live reply, 10 XML rules", False),
               ("live-xml-100", "live reply, 100 XML rules", False),
               ("live-xml-1000", "live reply, 1,000 XML rules", False)]
    # The XML form's parse has no target of its own: its whole conversion has.
    for key, what, parse_target in replies:
        bare = medians[f"xml/bare/{key}"]
        size = f"{bare['replyBytes'] / 1024:,.0f} KiB"
        for kind, label, target in (
                ("parse", "Trindle::parse", 0.5 if parse_target else None),
                ("convert", "whole live conversion", 0.3),
                ("qtjson", "Qt's JSON alone (each rule parsed, all written once)", None)):
            entry = medians.get(f"xml/{kind}/{key}")
            if not entry:
                continue
            ratio = entry["bytes_per_second"] / bare["bytes_per_second"]
            table.add(f"XML: {label}, {what} ({size})", mbps(entry),
                      f"bare QXmlStreamReader pass: {mbps(bare)}", f"{ratio:.2f}",
                      "reference" if target is None else f">= {target}",
                      None if target is None else ratio >= target)


def event_rows(table, medians):
    for count in (1, 100, 10000):
        emit = medians[f"BM_EmitToAll/{count}"]
        build = medians[f"BM_BuildRecords/{count}"]
        ratio = nanoseconds(emit) / nanoseconds(build)
        table.add(f"Events: one delivery to {count:,} subscriber{'s' if count > 1 else ''}",
                  f"{nanoseconds(emit) / 1e3:,.2f} µs",
                  f"building the records: {nanoseconds(build) / 1e3:,.2f} µs",
                  f"{ratio:.2f}x", "<= 2x", ratio <= 2)


def dispatch_rows(table, medians):
    build = medians["BM_BuildParams"]
    for index in range(8):
        entry = medians[f"BM_Request/{index}"]
        ratio = nanoseconds(entry) / nanoseconds(build)
        table.add(f"Dispatch: Request(\"{entry.get('label', index)}\"), proxy answers at once",
                  f"{nanoseconds(entry):,.0f} ns",
                  f"building the parameter map: {nanoseconds(build):,.0f} ns",
                  f"{ratio:.2f}x", "report", None)


def rate_text(report, unit):
    cpu = (f"; {report['cpuMicrosPerOp']:,.0f} µs CPU per request"
           if "cpuMicrosPerOp" in report else "")
    return (f"{report['opsPerSecond']:,.0f} {unit}/s "
            f"(p50 {report['p50Ms']:.2f} ms, p99 {report['p99Ms']:.2f} ms{cpu})")


def camera_rows(table, baseline, one, many, qt_only):
    base = f"wrk, 64 connections: {rate_text(baseline, 'req')}"
    for report, what in ((one, "1 camera"), (many, f"{CAMERA_PORTS} cameras")):
        ratio = report["opsPerSecond"] / baseline["opsPerSecond"]
        table.add(f"Camera HTTP: stopPTZMovement through Wendrel, {IN_FLIGHT} in flight, {what}",
                  rate_text(report, "ops"), base, f"{ratio:.2f}", ">= 0.5", ratio >= 0.5)
    ratio = qt_only["opsPerSecond"] / baseline["opsPerSecond"]
    table.add(f"Camera HTTP: the same GETs through QNetworkAccessManager alone, 1 camera",
              rate_text(qt_only, "req"), base, f"{ratio:.2f}", "reference", None)


def memory_rows(table, report, what):
    per_op = report["bytesPerOperation"]
    growth = (report["peakBytes"] - report["baselineBytes"]) / 2**20
    table.add(f"Memory: {report['count']:,} operations in flight against {what}",
              f"{per_op / 1024:.2f} KiB per operation (RSS +{growth:,.1f} MiB)", "—", "—",
              "<= 8 KiB", per_op <= 8192)
    count = report["count"]
    all_false = report["answeredOnce"] == count and report["answeredFalse"] == count
    in_time = report["earliestAfterDeadlineMs"] >= 0 and report["latestAfterDeadlineMs"] <= 1000
    cameras = report["cameras"]
    table.add(f"Deadline: the same {count:,} operations ({cameras} camera"
              f"{'s' if cameras > 1 else ''}) answered at their 10 s deadline",
              f"{report['answeredFalse']:,} of {count:,} false, once each; "
              f"{report['earliestAfterDeadlineMs']:.0f} to "
              f"{report['latestAfterDeadlineMs']:.0f} ms after it", "—", "—",
              "all, once, within 1 s", all_false and in_time)


def idle_rows(table, report):
    cameras = report["cameras"]
    wait = f"{report['idleMs'] / 1000 + 1:g} s"
    table.add(f"Idle: {cameras:,} distinct cameras, one request each, then open connections after "
              f"the idle time-out ({report['idleMs'] / 1000:g} s) plus 1 s",
              f"{report['openAfterIdle']} open ({report['openAtEnd']} at the end of the run, "
              f"{report['failed']} failed, {cameras / report['seconds']:,.0f} requests/s)",
              "—", "—", "0 open, none failed",
              report["openAfterIdle"] == 0 and report["failed"] == 0)
    warm = report["warmBytes"]
    after = report["afterBytes"]
    ratio = after / warm
    table.add(f"Idle: resident memory {wait} after those {cameras:,} cameras "
              "(the allocator's free memory given back first)",
              f"{after / 2**20:,.1f} MiB (peak {report['peakBytes'] / 2**20:,.1f} MiB)",
              f"after a first round of {report['warmup']:,} other cameras: {warm / 2**20:,.1f} MiB "
              f"(before any: {report['coldBytes'] / 2**20:,.1f} MiB)", f"{ratio:.2f}", "<= 1.1",
              ratio <= 1.1)


def machine():
    model = platform.processor() or "unknown CPU"
    try:
        with open("/proc/cpuinfo") as f:
            found = re.search(r"^model name\s*:\s*(.+)$", f.read(), re.M)
            model = found.group(1).strip() if found else model
    except OSError:
        pass
    system = platform.system()
    try:
        with open("/etc/os-release") as f:
            found = re.search(r'^PRETTY_NAME="?([^"\n]+)', f.read(), re.M)
            system = found.group(1) if found else system
    except OSError:
        pass
    return f"{os.cpu_count()} cores ({model}), {system}"


def on_sigterm(*_):
    raise KeyboardInterrupt


def main():
    if len(sys.argv) != 2:
        print(__doc__.strip(), file=sys.stderr)
        return 2
    build = os.path.abspath(sys.argv[1])
    results = os.path.join(build, "bench-results")
    os.makedirs(results, exist_ok=True)
    signal.signal(signal.SIGTERM, on_sigterm)
    bin_dir = os.path.join(build, "bin")
    table = Table()
    started = time.monotonic()

    def step(text):
        print(f"[{time.monotonic() - started:5.0f} s] {text}", file=sys.stderr, flush=True)

    try:
        step("XML parsing and conversion")
        xml_rows(table, google_benchmark(os.path.join(bin_dir, "quenvar-bench-xml"), results))
        step("event delivery")
        event_rows(table, google_benchmark(os.path.join(bin_dir, "quenvar-bench-events"), results))
        step("request dispatch")
        dispatch_rows(table,
                      google_benchmark(os.path.join(bin_dir, "quenvar-bench-dispatch"), results))
        with tempfile.TemporaryDirectory(prefix="quenvar-nginx-") as folder:
            step(f"camera HTTP against nginx on {CAMERA_PORTS} ports")
            with Nginx(folder, CAMERA_PORTS) as nginx:
                baseline = wrk(nginx.ports[0], results)
                one = camera_load(build, nginx.ports[:1], results, "1")
                many = camera_load(build, nginx.ports, results, str(CAMERA_PORTS))
                qt_only = camera_load(build, nginx.ports[:1], results, "qt-only", qt_only=True)
        camera_rows(table, baseline, one, many, qt_only)
        with tempfile.TemporaryDirectory(prefix="quenvar-nginx-") as folder:
            step(f"{IDLE_CAMERAS:,} distinct cameras, then idle")
            with Nginx(folder, 1, every_loopback_address=True) as nginx:
                idle_rows(table, idle(build, nginx.ports[0], results))
        for ports, what in ((1, "1 camera that accepts and never answers"),
                            (CAMERA_PORTS, f"{CAMERA_PORTS} cameras that accept and never answer")):
            step(f"memory and deadlines, {ports} camera(s)")
            with SilentServers(ports) as servers:
                memory_rows(table, memory(build, servers.ports, results, str(ports)), what)
    except BenchError as error:
        print(f"benchmark failed: {error}", file=sys.stderr)
        return 1
    except KeyboardInterrupt:
        print("interrupted", file=sys.stderr)
        return 1

    summary = (f"Measured {datetime.date.today().isoformat()} on {machine()}, "
               f"Qt {qt_only['qt']}, in {time.monotonic() - started:.0f} s.\n\n"
               f"{table.markdown()}\n")
    with open(os.path.join(results, "summary.md"), "w") as f:
        f.write(summary)
    print(summary)
    return 3 if table.missed else 0


if __name__ == "__main__":
    sys.exit(main())
