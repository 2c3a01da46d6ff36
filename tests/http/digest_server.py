#!/usr/bin/env python3
"""A loopback HTTP server that asks for Digest (RFC 7616) credentials, or Basic ones it never
accepts, and checks each answer itself with hashlib. It prints "listening on URL"; each request
gets its verdict, also a line on standard error: 200 "ok ALGORITHM USERNAME-FORM", else 401 with
the reason and fresh challenges."""

import argparse
import hashlib
import http.server
import re
import secrets
import sys
import urllib.parse

HASHES = {"MD5": "md5", "SHA-256": "sha256", "SHA-512-256": "sha512_256"}
REALM = "quenvar-test@example.org"
OPAQUE = "0paque/+="
PARAMETER = re.compile(r'\s*([A-Za-z0-9_*-]+)\s*=\s*(?:"((?:[^"\\]|\\.)*)"|([^,\s]*))\s*(?:,|$)')


def parse(text):
    fields, at = {}, 0
    while at < len(text):
        match = PARAMETER.match(text, at)
        name = match.group(1).lower()  # no match: AttributeError, a malformed answer
        if name in fields:
            raise ValueError("repeated " + name)
        quoted = match.group(2)
        fields[name] = re.sub(r"\\(.)", r"\1", quoted) if quoted is not None else match.group(3)
        at = match.end()
    return fields


class Handler(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"
    options = None
    nonces = {}  # nonce: requests it served
    digest_worked = False

    def log_message(self, *args):
        pass

    def do_GET(self):
        scheme, _, credentials = self.headers.get("Authorization", "none").partition(" ")
        try:
            verdict = self.check(parse(credentials)) if scheme == "Digest" else (scheme,)
        except (ValueError, KeyError, AttributeError, UnicodeError) as error:
            verdict = ("malformed %r" % error,)
        sys.stderr.write(verdict[0] + "\n")
        sys.stderr.flush()
        body = verdict[0].encode()
        passed = verdict[0].startswith("ok")
        self.send_response(200 if passed else 401)
        for algorithm in [] if passed else self.offered():
            challenge = 'Basic realm="%s"' % REALM
            if algorithm != "Basic":
                nonce = secrets.token_urlsafe(24)
                Handler.nonces[nonce] = 0
                challenge = 'Digest realm="%s", nonce="%s", opaque="%s", algorithm=%s, ' \
                    'qop="auth, auth-int"' % (REALM, nonce, OPAQUE, algorithm)
                challenge += ", charset=UTF-8, userhash=true" if self.options.userhash else ""
                challenge += ", stale=true" if len(verdict) > 1 else ""
            self.send_header("WWW-Authenticate", challenge)
        self.send_header("Content-Length", str(len(body)))
        self.end_headers()
        self.wfile.write(body)

    def offered(self):
        return ["Basic"] if Handler.digest_worked and self.options.basic_after_digest \
            else self.options.offer.split(",")

    def check(self, fields):
        """The verdict, and whether the nonce was stale."""
        algorithm = fields.get("algorithm", "MD5")
        if algorithm not in self.offered():
            return ("digest unasked " + algorithm,)
        base = algorithm[:-5] if algorithm.endswith("-sess") else algorithm

        def h(text):
            return hashlib.new(HASHES[base], text.encode()).hexdigest()
        user = self.options.user
        form, claimed = "username", fields.get("username")
        if fields.get("userhash") == "true":
            form, claimed = "userhash", user if claimed == h("%s:%s" % (user, REALM)) else None
        elif "username*" in fields:
            charset, _, encoded = fields["username*"].partition("''")
            if charset != "UTF-8" or claimed is not None:
                raise ValueError("username*")
            form, claimed = "username*", urllib.parse.unquote(encoded, errors="strict")
        if (claimed, fields["realm"], fields["uri"], fields["opaque"]) != \
                (user, REALM, self.path, OPAQUE):
            return ("digest mismatch",)
        nonce = fields["nonce"]
        if nonce not in Handler.nonces:
            return ("digest unknown nonce",)
        if self.options.nonce_uses and Handler.nonces[nonce] >= self.options.nonce_uses:
            return ("digest stale", True)
        Handler.nonces[nonce] += 1
        secret = h("%s:%s:%s" % (user, REALM, self.options.password))
        if algorithm != base:
            secret = h("%s:%s:%s" % (secret, nonce, fields["cnonce"]))
        if fields["qop"] != "auth" or not re.fullmatch("[0-9a-f]{8}", fields["nc"]):
            return ("digest qop",)
        expected = h(":".join([secret, nonce, fields["nc"], fields["cnonce"], "auth",
                               h("GET:" + fields["uri"])]))
        if fields["response"] != expected:
            return ("digest wrong",)
        Handler.digest_worked = True
        return ("ok %s %s" % (algorithm, form),)


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    for option in ["--user", "--password", "--offer"]:  # offer: algorithms and Basic, in order
        parser.add_argument(option, required=True)
    parser.add_argument("--userhash", action="store_true")
    parser.add_argument("--nonce-uses", type=int, default=0)  # before a nonce is stale; 0: ever
    parser.add_argument("--basic-after-digest", action="store_true")  # then offer Basic alone
    Handler.options = parser.parse_args()
    server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), Handler)
    server.daemon_threads = True
    print("listening on http://127.0.0.1:%d" % server.server_address[1], flush=True)
    server.serve_forever()


if __name__ == "__main__":
    main()
