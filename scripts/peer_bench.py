#!/usr/bin/env python3
"""Side-by-side benchmark: this library's REST calls and JSON reading against
other C++ clients, each measured in its own process against one nginx.

  scripts/peer_bench.py --bin build-release/bench/peers --rounds 5
  scripts/peer_bench.py --quick                  # a smoke test, small runs
  scripts/peer_bench.py --only seq,h2_64         # some kinds of work only
  scripts/peer_bench.py --json-only              # JSON reading only

(scripts/bench.sh --peers builds the clients first, then runs this.)

What runs: nginx, started here as a process of its own (never a daemon, all
its files in a temporary directory) on three free 127.0.0.1 ports: plain
HTTP/1.1, HTTPS without HTTP/2, HTTPS with HTTP/2, behind a self-signed
certificate made for 127.0.0.1. Every client executable (bench/peers: bare
libcurl, this library, Qt 6, POCO; whichever were built) does each kind of
work once per round:

  seq    10,000 GETs one after the other (HTTP/1.1)
  c64    100 rounds of 64 GETs at once, HTTP/1.1, 8 connections
  tls64  the same over HTTPS, HTTP/1.1
  h2_64  the same over HTTPS, HTTP/2 on one connection

and peer_json reads a 1 MB document with each JSON library. Rounds are
interleaved (every client and library once per round, the order rotated from
round to round), so a slow spell of the machine touches all of them alike.

How to read it: wall is steady-clock time of the measured part; CPU is the
client process's own user + system time over the same part (the server runs
in its own process and is not in it), per request; connections are the TCP
connections the server accepted during the run (nginx stub_status, the
warm-up's connection included). Every cell is the median over the rounds,
with the spread (max - min) / 2 in per cent; ratios divide by bare libcurl
(RapidJSON for JSON), so below 1.00 is better than the baseline. The last line
holds the ratios the library is tuned by:

  peer-ratios: seq_wall=… seq_cpu=… c64_wall=… c64_cpu=… tls64_wall=…
               tls64_connections=… h2_64_connections=… json_vs_rapidjson=…

(one line; connections are this library's counts). A client run that fails
is shown as FAILED with its message, and the script exits 1 at the end.
"""
import argparse
import ctypes
import json
import os
import shutil
import signal
import socket
import ssl
import statistics
import subprocess
import sys
import tempfile
import time
import urllib.request

ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))

# (name the executables use, column heading)
CLIENTS = [("curl", "bare libcurl"), ("kivi", "this library"), ("qt", "Qt 6"), ("poco", "Poco")]
JSON_LIBS = [("kivi", "this library"), ("rapidjson", "RapidJSON"), ("nlohmann", "nlohmann"),
             ("qt", "Qt 6"), ("simdjson", "simdjson")]
HTTP_MODES = ["seq", "c64", "tls64", "h2_64"]
# Which server each kind of work talks to.
SERVER_OF_MODE = {"seq": "http", "c64": "http", "tls64": "https", "h2_64": "h2"}
ANSWER = '{"ok":true,"n":42}'
RUN_TIMEOUT_S = 600

# (kind of work the note is about, note)
NOTES = [
    ("http", "CPU is the client process's user + system time (getrusage) over the measured part "
             "only; nginx runs in its own process."),
    ("http", "Connections: TCP connections nginx accepted during the run (stub_status), the "
             "warm-up's included."),
    ("http", "Qt 6 opens at most 6 HTTP/1.1 connections per host and has no setting for it: its "
             "c64 and tls64 runs use 6 where the other clients use 8."),
    ("http", "this library, tls64: the URL session has no setting to turn HTTP/2 off over TLS; "
             "it offers h2 and talks HTTP/1.1 because this server offers nothing else."),
    ("http", "Poco has no HTTP/2 client (h2_64 not run); its concurrent runs are 8 threads, each "
             "with a keep-alive session."),
    ("json", "RapidJSON runs with its default flags, which check neither UTF-8 nor round doubles "
             "exactly; this library does both. simdjson gets a new parser per document."),
]


class Failure(Exception):
    pass


# --- the server ---------------------------------------------------------------


def free_ports(count):
    sockets = []
    try:
        for _ in range(count):
            s = socket.socket(socket.AF_INET, socket.SOCK_STREAM)
            s.bind(("127.0.0.1", 0))
            sockets.append(s)
        return [s.getsockname()[1] for s in sockets]
    finally:
        for s in sockets:
            s.close()


def make_certificate(directory):
    cert = os.path.join(directory, "cert.pem")
    key = os.path.join(directory, "key.pem")
    command = ["openssl", "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-sha256",
               "-days", "2", "-subj", "/CN=127.0.0.1", "-addext", "subjectAltName=IP:127.0.0.1",
               "-keyout", key, "-out", cert]
    result = subprocess.run(command, capture_output=True, text=True)
    if result.returncode != 0:
        raise Failure("openssl req failed:\n" + result.stderr)
    return cert, key


def nginx_conf(directory, ports, cert, key):
    json_location = """
    location = /json {
      default_type application/json;
      return 200 '%s';
    }""" % ANSWER
    tls = """
    ssl_certificate %s;
    ssl_certificate_key %s;""" % (cert, key)
    temp = "\n".join("  %s_temp_path %s;" % (name, os.path.join(directory, name))
                     for name in ("client_body", "proxy", "fastcgi", "uwsgi", "scgi"))
    return """# Written by scripts/peer_bench.py for one run.
worker_processes 1;
pid %(dir)s/nginx.pid;
error_log %(dir)s/error.log warn;
events {
  worker_connections 1024;
}
http {
  access_log off;
%(temp)s
  keepalive_requests 1000000;
  keepalive_timeout 300;
  server {
    listen 127.0.0.1:%(http)d;%(json)s
    location = /status {
      stub_status;
    }
  }
  server {
    listen 127.0.0.1:%(https)d ssl;%(tls)s%(json)s
  }
  server {
    listen 127.0.0.1:%(h2)d ssl http2;%(tls)s%(json)s
  }
}
""" % {"dir": directory, "temp": temp, "http": ports["http"], "https": ports["https"],
       "h2": ports["h2"], "json": json_location, "tls": tls}


def server_process_setup():
    # Out of the terminal's process group: Ctrl-C reaches this script, which
    # then stops the server itself, and not the server in the middle of a run.
    os.setpgrp()
    # The server goes when this script goes, even when it is killed.
    try:
        libc = ctypes.CDLL(None, use_errno=True)
        libc.prctl(1, signal.SIGTERM)  # PR_SET_PDEATHSIG
    except (OSError, AttributeError):
        pass


class Nginx:
    def __init__(self, directory):
        self.directory = directory
        self.process = None
        self.ports = dict(zip(("http", "https", "h2"), free_ports(3)))
        self.cert, key = make_certificate(directory)
        self.conf = os.path.join(directory, "nginx.conf")
        with open(self.conf, "w") as f:
            f.write(nginx_conf(directory, self.ports, self.cert, key))
        self.ssl_context = ssl.create_default_context(cafile=self.cert)

    def url_base(self, server):
        scheme = "http" if server == "http" else "https"
        return "%s://127.0.0.1:%d" % (scheme, self.ports[server])

    def start(self):
        nginx = shutil.which("nginx") or "/usr/sbin/nginx"
        command = [nginx, "-p", self.directory, "-e", os.path.join(self.directory, "error.log"),
                   "-c", self.conf, "-g", "daemon off;"]
        self.log = open(os.path.join(self.directory, "nginx.out"), "w")
        self.process = subprocess.Popen(command, stdout=self.log, stderr=subprocess.STDOUT,
                                        stdin=subprocess.DEVNULL, preexec_fn=server_process_setup)
        deadline = time.monotonic() + 15
        while True:
            if self.process.poll() is not None:
                raise Failure("nginx exited with status %d:\n%s" %
                              (self.process.returncode, self.logs()))
            try:
                self.counters()
                break
            except OSError:
                if time.monotonic() > deadline:
                    raise Failure("nginx did not answer within 15 s:\n" + self.logs())
                time.sleep(0.05)
        for server in ("http", "https", "h2"):
            body = self.fetch(self.url_base(server) + "/json")
            if body != ANSWER:
                raise Failure("%s server answered %r" % (server, body))

    def logs(self):
        text = []
        for name in ("nginx.out", "error.log"):
            path = os.path.join(self.directory, name)
            if os.path.exists(path):
                with open(path, errors="replace") as f:
                    text.append(f.read())
        return "".join(text)

    def fetch(self, url):
        context = self.ssl_context if url.startswith("https") else None
        with urllib.request.urlopen(url, timeout=10, context=context) as response:
            return response.read().decode()

    def counters(self):
        """(accepts, requests) so far. The request that asks counts in both."""
        text = self.fetch(self.url_base("http") + "/status")
        numbers = text.splitlines()[2].split()
        return int(numbers[0]), int(numbers[2])

    def counters_while_running(self):
        try:
            return self.counters()
        except OSError as error:
            state = "exited" if self.process.poll() is not None else "is running"
            raise Failure("nginx stopped answering (%s; it %s):\n%s" %
                          (error, state, self.logs()))

    def stop(self):
        if not self.process:
            return
        if self.process.poll() is None:
            self.process.terminate()
            try:
                self.process.wait(timeout=10)
            except subprocess.TimeoutExpired:
                self.process.kill()
                self.process.wait()
        self.log.close()


# --- the runs -----------------------------------------------------------------


class Results:
    def __init__(self):
        self.runs = {}      # (client, mode) -> [record]
        self.skipped = {}   # (client, mode) -> why
        self.failed = {}    # (client, mode) -> [message]
        self.raw = []

    def add(self, key, record):
        self.raw.append(record)
        if "skipped" in record:
            self.skipped[key] = record["skipped"]
        elif "error" in record:
            self.failed.setdefault(key, []).append(record["error"])
        else:
            self.runs.setdefault(key, []).append(record)


def run_client(command):
    """The client's one JSON line, or a record with an "error"."""
    try:
        result = subprocess.run(command, capture_output=True, text=True, timeout=RUN_TIMEOUT_S)
    except subprocess.TimeoutExpired:
        return {"error": "no answer within %d s" % RUN_TIMEOUT_S}
    lines = [line for line in result.stdout.splitlines() if line.strip()]
    if result.returncode != 0 or not lines:
        message = result.stderr.strip() or "exit status %d" % result.returncode
        return {"error": message.splitlines()[-1]}
    try:
        return json.loads(lines[-1])
    except ValueError:
        return {"error": "not a result line: " + lines[-1]}


def rotated(items, by):
    if not items:
        return items
    by %= len(items)
    return items[by:] + items[:by]


def run_http(nginx, binary, client, mode, args, results):
    command = [binary, "--mode", mode, "--url-base", nginx.url_base(SERVER_OF_MODE[mode]),
               "--cacert", nginx.cert, "--requests", str(args.requests),
               "--rounds", str(args.client_rounds)]
    accepts_before, requests_before = nginx.counters_while_running()
    record = run_client(command)
    accepts_after, requests_after = nginx.counters_while_running()
    record.setdefault("client", client)
    record.setdefault("mode", mode)
    if "skipped" not in record and "error" not in record:
        # Each counters() call is one request on one new connection.
        record["connections"] = accepts_after - accepts_before - 1
        seen = requests_after - requests_before - 1
        expected = 64 * args.client_rounds if mode != "seq" else args.requests
        if record.get("failures", 0) != 0 or record.get("requests") != expected:
            record = {"client": client, "mode": mode,
                      "error": "reported %s requests, %s failures" %
                               (record.get("requests"), record.get("failures"))}
        elif seen < expected + 1:
            record = {"client": client, "mode": mode,
                      "error": "the server saw %d requests, %d expected" % (seen, expected + 1)}
    results.add((client, mode), record)
    return record


def run_json(binary, lib, args, results):
    record = run_client([binary, "--lib", lib, "--iterations", str(args.iterations)])
    record.setdefault("client", lib)
    record.setdefault("mode", "json")
    results.add((lib, "json"), record)
    return record


def describe(record):
    if "skipped" in record:
        return "skipped (%s)" % record["skipped"]
    if "error" in record:
        return "FAILED: " + record["error"]
    if record["mode"] == "json":
        return "%.2f ms" % record["median_ms"]
    return "wall %.1f ms, cpu %.1f us/request, %d connection(s)" % (
        record["wall_s"] * 1e3, record["cpu_s"] / record["requests"] * 1e6, record["connections"])


# --- the report ---------------------------------------------------------------


def spread(values):
    middle = statistics.median(values)
    if len(values) < 2 or middle == 0:
        return ""
    return " ±%.0f%%" % ((max(values) - min(values)) / 2 / middle * 100)


def ratio_text(value, base):
    if value is None or base is None or base == 0:
        return ""
    return " (%.2f×)" % (value / base)


class Table:
    def __init__(self, heading):
        self.rows = [heading]

    def add(self, row):
        self.rows.append(row)

    def text(self):
        widths = [max(len(row[i]) for row in self.rows) for i in range(len(self.rows[0]))]
        lines = []
        for n, row in enumerate(self.rows):
            lines.append("| " + " | ".join(cell.ljust(w) for cell, w in zip(row, widths)) + " |")
            if n == 0:
                lines.append("|" + "|".join("-" * (w + 2) for w in widths) + "|")
        return "\n".join(lines)


def http_metrics(records):
    wall = [r["wall_s"] * 1e3 for r in records]
    cpu = [r["cpu_s"] / r["requests"] * 1e6 for r in records]
    connections = [r["connections"] for r in records]
    return wall, cpu, connections


def kept_connections(client, mode):
    """The connections a client that keeps its connections opens in a run."""
    if mode in ("seq", "h2_64"):
        return 1
    return 6 if client == "qt" else 8


def mode_title(mode, args):
    if mode == "seq":
        return "seq: %d GETs one after the other, HTTP/1.1" % args.requests
    transport = {"c64": "HTTP/1.1", "tls64": "HTTPS, HTTP/1.1", "h2_64": "HTTPS, HTTP/2"}[mode]
    connections = "1 connection" if mode == "h2_64" else "8 connections"
    return "%s: %d rounds of 64 GETs at once, %s, %s" % (mode, args.client_rounds, transport,
                                                         connections)


def report(results, clients, modes, json_libs, args):
    medians = {}  # (client, mode) -> (wall ms, cpu us/request, connections)
    for key, records in results.runs.items():
        if key[1] == "json":
            medians[key] = statistics.median(r["median_ms"] for r in records)
        else:
            wall, cpu, connections = http_metrics(records)
            medians[key] = (statistics.median(wall), statistics.median(cpu),
                            statistics.median_low(connections))

    def cell_problem(key):
        if key in results.failed:
            return "FAILED (%d of %d runs): %s" % (len(results.failed[key]), args.rounds,
                                                   results.failed[key][0])
        if key in results.skipped:
            return "not run: " + results.skipped[key]
        return None

    if modes:
        print()
        table = Table(["Work"] + [title for _, title in clients])
        for mode in modes:
            table.add(["**" + mode_title(mode, args) + "**"] + [""] * len(clients))
            base = medians.get(("curl", mode)) if ("curl", mode) not in results.failed else None
            for index, label in ((0, "wall ms"), (1, "CPU µs per request"), (2, "connections")):
                row = ["  " + label]
                for client, _ in clients:
                    key = (client, mode)
                    problem = cell_problem(key)
                    if problem:
                        row.append(problem if index == 0 else "")
                        continue
                    if key not in results.runs:
                        row.append("")
                        continue
                    values = http_metrics(results.runs[key])[index]
                    value = medians[key][index]
                    if index == 2:
                        low, high = min(values), max(values)
                        row.append("%d" % value + (" (%d–%d)" % (low, high) if low != high else ""))
                        continue
                    text = ("%.1f" if index == 0 else "%.2f") % value + spread(values)
                    if client != "curl" and base:
                        text += ratio_text(value, base[index])
                    row.append(text)
                table.add(row)
        print(table.text())

    if json_libs:
        print()
        document_bytes = next((r["bytes"] for k, rs in results.runs.items() if k[1] == "json"
                               for r in rs), None)
        table = Table(["Work"] + [title for _, title in json_libs])
        title = "JSON parse + free, %s, ms (median of %d)" % (
            "%.2f MB" % (document_bytes / 1e6) if document_bytes else "1 MB", args.iterations)
        row = [title]
        base = medians.get(("rapidjson", "json"))
        for lib, _ in json_libs:
            key = (lib, "json")
            problem = cell_problem(key)
            if problem:
                row.append(problem)
                continue
            values = [r["median_ms"] for r in results.runs.get(key, [])]
            if not values:
                row.append("")
                continue
            text = "%.2f%s" % (medians[key], spread(values))
            if lib != "rapidjson" and base:
                text += ratio_text(medians[key], base)
            row.append(text)
        table.add(row)
        print(table.text())

    print()
    print("Medians over %d interleaved rounds; ± is (max - min) / 2 of the rounds; (n×) is the "
          "ratio to bare libcurl (to RapidJSON for JSON)." % args.rounds)
    print("Machine: %d CPUs; load average %.2f when the runs began, %.2f when they ended "
          "(other work on the machine widens the ±)." % (os.cpu_count() or 0, args.load_before,
                                                        os.getloadavg()[0]))
    for kind, note in NOTES:
        if (kind == "http" and modes) or (kind == "json" and json_libs):
            print("- " + note)
    titles = dict(clients)
    for (client, mode), records in sorted(results.runs.items()):
        if mode == "json":
            continue
        most = max(r["connections"] for r in records)
        if most > kept_connections(client, mode):
            print("- %s, %s: up to %d connections in a run where %d would do: it closed and "
                  "opened connections during the run." % (titles.get(client, client), mode, most,
                                                          kept_connections(client, mode)))
    print()

    def ratio(mode, index):
        kivi, curl = medians.get(("kivi", mode)), medians.get(("curl", mode))
        if not kivi or not curl or ("kivi", mode) in results.failed or \
                ("curl", mode) in results.failed or not curl[index]:
            return "n/a"
        return "%.2f" % (kivi[index] / curl[index])

    def connections(mode):
        kivi = medians.get(("kivi", mode))
        if not kivi or ("kivi", mode) in results.failed:
            return "n/a"
        return "%d" % kivi[2]

    kivi_json, rapid_json = medians.get(("kivi", "json")), medians.get(("rapidjson", "json"))
    json_ratio = "n/a"
    if kivi_json and rapid_json and ("kivi", "json") not in results.failed and \
            ("rapidjson", "json") not in results.failed:
        json_ratio = "%.2f" % (kivi_json / rapid_json)
    print("peer-ratios: seq_wall=%s seq_cpu=%s c64_wall=%s c64_cpu=%s tls64_wall=%s "
          "tls64_connections=%s h2_64_connections=%s json_vs_rapidjson=%s" % (
              ratio("seq", 0), ratio("seq", 1), ratio("c64", 0), ratio("c64", 1),
              ratio("tls64", 0), connections("tls64"), connections("h2_64"), json_ratio))


# --- main ---------------------------------------------------------------------


def parse_args(argv):
    parser = argparse.ArgumentParser(
        description="Side-by-side benchmark of this library against other C++ clients.",
        epilog="See the top of scripts/peer_bench.py for what is measured and how to read it.")
    parser.add_argument("--rounds", type=int, default=5,
                        help="interleaved rounds, each running every client once (default 5)")
    parser.add_argument("--bin", default=os.path.join(ROOT, "build-release", "bench", "peers"),
                        help="where the peer_* executables are (default build-release/bench/peers)")
    parser.add_argument("--only", default="",
                        help="comma-separated kinds of work: seq, c64, tls64, h2_64, json")
    parser.add_argument("--json-only", action="store_true", help="only the JSON reading")
    parser.add_argument("--quick", action="store_true",
                        help="small runs for a smoke test (500 GETs, 5 rounds of 64, "
                             "10 JSON reads)")
    parser.add_argument("--raw", metavar="FILE", help="also write every run's line to FILE")
    parser.add_argument("--serve", action="store_true",
                        help="only start the server, print its URLs and certificate, and keep "
                             "it until Ctrl-C (for profiling a client by hand)")
    args = parser.parse_args(argv)
    if args.rounds < 1:
        parser.error("--rounds must be at least 1")
    known = HTTP_MODES + ["json"]
    wanted = [m for m in args.only.split(",") if m] if args.only else known
    unknown = [m for m in wanted if m not in known]
    if unknown:
        parser.error("unknown kind of work: " + ", ".join(unknown))
    if args.json_only:
        wanted = ["json"]
    args.modes = [m for m in HTTP_MODES if m in wanted]
    args.json = "json" in wanted
    args.requests, args.client_rounds, args.iterations = (
        (500, 5, 10) if args.quick else (10000, 100, 200))
    return args


def main(argv):
    args = parse_args(argv)

    def available(name):
        path = os.path.join(args.bin, "peer_" + name)
        return path if os.access(path, os.X_OK) else None

    clients = [(c, t) for c, t in CLIENTS if available(c)]
    missing = [t for c, t in CLIENTS if not available(c)]
    if args.modes and not any(c == "curl" for c, _ in clients):
        sys.exit("peer_bench: no peer_curl in %s (build it: scripts/bench.sh --peers)" % args.bin)
    if missing and args.modes:
        print("peer_bench: not built, left out: " + ", ".join(missing), file=sys.stderr)
    json_binary = available("json") if args.json else None
    if args.json and not json_binary:
        sys.exit("peer_bench: no peer_json in %s" % args.bin)
    json_libs = JSON_LIBS if args.json else []

    results = Results()
    directory = tempfile.mkdtemp(prefix="kivi-peer-bench-")
    os.chmod(directory, 0o755)  # nginx's workers may run as another user
    nginx = None
    # Ctrl-C (also when started with SIGINT ignored, as a background job is),
    # SIGTERM and SIGHUP unwind, so the server is stopped.
    signal.signal(signal.SIGINT, signal.default_int_handler)
    for signum in (signal.SIGTERM, signal.SIGHUP):
        signal.signal(signum, lambda number, frame: sys.exit(128 + number))
    try:
        if args.modes:
            nginx = Nginx(directory)
            nginx.start()
            print("peer_bench: nginx on 127.0.0.1 ports http %(http)d, https %(https)d, "
                  "h2 %(h2)d" % nginx.ports, file=sys.stderr)
        if args.serve:
            if not nginx:
                nginx = Nginx(directory)
                nginx.start()
            for server in ("http", "https", "h2"):
                print("%-5s %s/json" % (server, nginx.url_base(server)))
            print("cacert %s" % nginx.cert, flush=True)
            signal.pause()
        args.load_before = os.getloadavg()[0]
        names = [c for c, _ in clients]
        libs = [l for l, _ in json_libs]
        for round_index in range(args.rounds):
            for mode in args.modes:
                for client in rotated(names, round_index):
                    record = run_http(nginx, available(client), client, mode, args, results)
                    print("round %d/%d %-5s %-4s %s" % (round_index + 1, args.rounds, mode, client,
                                                        describe(record)), file=sys.stderr)
            for lib in rotated(libs, round_index):
                record = run_json(json_binary, lib, args, results)
                print("round %d/%d json  %-9s %s" % (round_index + 1, args.rounds, lib,
                                                      describe(record)), file=sys.stderr)
    except KeyboardInterrupt:
        print("peer_bench: interrupted", file=sys.stderr)
        return 130
    except Failure as failure:
        print("peer_bench: %s" % failure, file=sys.stderr)
        return 1
    finally:
        if nginx:
            nginx.stop()
        shutil.rmtree(directory, ignore_errors=True)

    if args.raw:
        with open(args.raw, "w") as f:
            for record in results.raw:
                f.write(json.dumps(record) + "\n")
    report(results, clients, args.modes, json_libs, args)
    return 1 if results.failed else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
