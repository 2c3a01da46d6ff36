#!/usr/bin/env python3
"""An HTTP server on a free loopback port that asks for Digest (RFC 7616) or Basic credentials and
checks each answer on its own, with hashlib. Its first line of output is "listening on URL"; each
request then logs one line to standard error: "path verdict". A request that passes gets 200 and
the body "ok ALGORITHM USERNAME-FORM" ("ok Basic" for Basic)."""

import argparse
import base64
import hashlib
import http.server
import re
import secrets
import signal
import subprocess
import sys
import threading
import urllib.parse

HASHES = {"MD5": "md5", "SHA-256": "sha256", "SHA-512-256": "sha512_256"}
REALM = "quenvar-test@example.org"
PARAMETER = re.compile(r'\s*([A-Za-z0-9_*-]+)\s*=\s*("((?:[^"\\]|\\.)*)"|[^,\s]*)\s*(,|$)')


def hex_digest(algorithm, data):
    name = HASHES[algorithm]
    try:
        return hashlib.new(name, data).hexdigest()
    except ValueError:
        # Some OpenSSL builds give Python no SHA-512/256; the openssl command has it.
        if name != "sha512_256":
            raise
        out = subprocess.run(["openssl", "dgst", "-sha512-256", "-r"], input=data,
                             capture_output=True, check=True).stdout
        return out.split()[0].decode()


def parse_parameters(text):
    parameters = {}
    at = 0
    while at < len(text):
        match = PARAMETER.match(text, at)
        if not match:
            raise ValueError("unreadable credentials at %d" % at)
        value = match.group(3)
        value = re.sub(r"\\(.)", r"\1", value) if value is not None else match.group(2)
        name = match.group(1).lower()
        if name in parameters:
            raise ValueError("repeated " + name)
        parameters[name] = value
        at = match.end()
    return parameters


class State:
    def __init__(self, options):
        self.options = options
        self.lock = threading.Lock()
        self.nonces = {}  # nonce -> requests it served
        self.digest_worked = False

    def new_nonce(self):
        nonce = secrets.token_urlsafe(24)
        with self.lock:
            self.nonces[nonce] = 0
        return nonce

    def use_nonce(self, nonce):
        """'fresh', 'stale' or 'unknown'."""
        with self.lock:
            if nonce not in self.nonces:
                return "unknown"
            if self.options.nonce_uses and self.nonces[nonce] >= self.options.nonce_uses:
                return "stale"
            self.nonces[nonce] += 1
            return "fresh"


class Handler(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"
    state = None

    def log_message(self, format, *args):
        pass

    def note(self, verdict):
        sys.stderr.write("%s %s\n" % (self.path, verdict))
        sys.stderr.flush()

    def reply(self, status, body, challenges=()):
        data = body.encode()
        self.send_response(status)
        for challenge in challenges:
            self.send_header("WWW-Authenticate", challenge)
        self.send_header("Content-Type", "text/plain")
        self.send_header("Content-Length", str(len(data)))
        self.end_headers()
        self.wfile.write(data)

    def challenges(self, stale=False):
        options = self.state.options
        offered = ["Basic"] if self.state.digest_worked and options.basic_after_digest \
            else options.offer.split(",")
        result = []
        for algorithm in offered:
            if algorithm == "Basic":
                result.append('Basic realm="%s", charset="UTF-8"' % REALM)
                continue
            challenge = 'Digest realm="%s", nonce="%s", opaque="%s", algorithm=%s' % (
                REALM, self.state.new_nonce(), options.opaque, algorithm)
            if options.qop:
                challenge += ', qop="auth, auth-int"'
            if options.userhash:
                challenge += ", charset=UTF-8, userhash=true"
            if stale:
                challenge += ", stale=true"
            result.append(challenge)
        return result

    def refuse(self, verdict, stale=False):
        self.note(verdict)
        self.reply(401, verdict, self.challenges(stale))

    def do_GET(self):
        header = self.headers.get("Authorization")
        if header is None:
            return self.refuse("none")
        scheme, _, credentials = header.partition(" ")
        try:
            if scheme.lower() == "basic":
                return self.check_basic(credentials)
            if scheme.lower() == "digest":
                return self.check_digest(parse_parameters(credentials))
        except (ValueError, KeyError, UnicodeError) as error:
            return self.refuse("malformed %s" % error)
        return self.refuse("scheme " + scheme)

    def check_basic(self, credentials):
        options = self.state.options
        offered = "Basic" in options.offer.split(",") or (
            self.state.digest_worked and options.basic_after_digest)
        user, _, password = base64.b64decode(credentials, validate=True).decode().partition(":")
        if not offered:
            return self.refuse("basic unasked")
        if (user, password) != (options.user, options.password):
            return self.refuse("basic wrong")
        self.note("basic ok")
        self.reply(200, "ok Basic")

    def user_of(self, fields, algorithm):
        """The user name the answer claims, and the form it came in."""
        if fields.get("userhash") == "true":
            expected = hex_digest(algorithm, ("%s:%s" % (self.state.options.user, REALM)).encode())
            return (self.state.options.user if fields["username"] == expected else None), "userhash"
        if "username*" in fields:
            if "username" in fields:
                raise ValueError("username and username*")
            charset, _, encoded = fields["username*"].partition("''")
            if charset.upper() != "UTF-8":
                raise ValueError("charset " + charset)
            return urllib.parse.unquote(encoded, encoding="utf-8", errors="strict"), "username*"
        return fields["username"], "username"

    def check_digest(self, fields):
        options = self.state.options
        algorithm = fields.get("algorithm", "MD5")
        base = algorithm[:-5] if algorithm.endswith("-sess") else algorithm
        if algorithm not in options.offer.split(",") or self.state.digest_worked and \
                options.basic_after_digest:
            return self.refuse("digest unasked " + algorithm)
        if fields["realm"] != REALM or fields["uri"] != self.path or \
                fields.get("opaque") != options.opaque:
            return self.refuse("digest mismatch")
        user, form = self.user_of(fields, base)
        if user != options.user:
            return self.refuse("digest user")
        freshness = self.state.use_nonce(fields["nonce"])
        if freshness != "fresh":
            return self.refuse("digest " + freshness, stale=freshness == "stale")

        def h(text):
            return hex_digest(base, text.encode())
        secret = h("%s:%s:%s" % (user, REALM, options.password))
        if algorithm.endswith("-sess"):
            secret = h("%s:%s:%s" % (secret, fields["nonce"], fields["cnonce"]))
        request = h("GET:" + fields["uri"])
        if options.qop:
            if fields["qop"] != "auth" or not re.fullmatch(r"[0-9a-f]{8}", fields["nc"]):
                return self.refuse("digest qop")
            expected = h(":".join([secret, fields["nonce"], fields["nc"], fields["cnonce"],
                                   "auth", request]))
        else:
            expected = h(":".join([secret, fields["nonce"], request]))
        if fields["response"] != expected:
            return self.refuse("digest wrong")
        self.state.digest_worked = True
        self.note("digest ok %s %s" % (algorithm, form))
        self.reply(200, "ok %s %s" % (algorithm, form))


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("--user", required=True)
    parser.add_argument("--password", required=True)
    parser.add_argument("--offer", default="SHA-256,MD5",
                        help="challenges in order: Digest algorithms and Basic, by commas")
    parser.add_argument("--no-qop", dest="qop", action="store_false")
    parser.add_argument("--userhash", action="store_true")
    parser.add_argument("--opaque", default="0paque/+=")
    parser.add_argument("--nonce-uses", type=int, default=0,
                        help="requests a nonce serves before it is stale; 0: no limit")
    parser.add_argument("--basic-after-digest", action="store_true",
                        help="once Digest has worked, ask for Basic only")
    options = parser.parse_args()

    Handler.state = State(options)
    server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), Handler)
    server.daemon_threads = True
    signal.signal(signal.SIGTERM, lambda *_: sys.exit(0))
    print("listening on http://127.0.0.1:%d" % server.server_address[1], flush=True)
    server.serve_forever()


if __name__ == "__main__":
    main()
