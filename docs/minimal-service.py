#!/usr/bin/python3
"""A search service as small as it can be: a bag, searches, uploads, each kept in a file. service.md says what a real one adds.
Usage: minimal-service.py CERTIFICATE KEY DIRECTORY [PORT]"""
import hashlib
import http.server
import json
import pathlib
import ssl
import sys
import urllib.parse
import zlib

CERTIFICATE, KEY, DIRECTORY, PORT = (sys.argv[1:] + ["8443"])[:4]
TITLES = ["Weather in Zürich", "Weather in Tokyo", "Paris", "Parrots", "Berlin"]


def result_set(place, title):
    result = {"identifier": title, "title": title, "url": "https://example.org/?" + urllib.parse.quote(title), "fbr": str(place)}
    return {"status": "OK", "query": title.casefold(), "completion_score": 1 / (1 + place), "max_age": 600, "results": [result]}


class Service(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"  # keeps connections open

    def do_GET(self):
        url = urllib.parse.urlsplit(self.path)
        if url.path == "/bag":
            self.answer({"version": 1, "searchURL": BASE + "/search", "feedbackURL": BASE + "/feedback"})
        elif url.path == "/search":  # a set for each title that completes the text; it answers the user's next keys, too
            typed = urllib.parse.parse_qs(url.query).get("q", [""])[0].casefold()
            self.answer([result_set(*each) for each in enumerate(TITLES) if each[1].casefold().startswith(typed)])
        else:
            self.answer({}, 404)

    def do_POST(self):
        try:  # DEFLATE without a header
            text = zlib.decompressobj(-15).decompress(self.rfile.read(max(int(self.headers["Content-Length"]), 0)), 32 << 20)
            digest = hashlib.sha512(text).hexdigest()
            accepted = digest == self.headers["X-Quorvane-Digest"] and "fb" in json.loads(text)
        except (TypeError, ValueError, zlib.error):
            accepted = False
        if accepted:  # kept before the answer; an upload that is repeated changes nothing
            pathlib.Path(DIRECTORY, digest + ".json").write_bytes(text)
        self.answer({}, 200 if accepted else 400)  # after any other status than 200 the session is not sent again

    def answer(self, value, status=200):
        self.send_response(status)
        body = json.dumps(value).encode()
        self.send_header("Content-Length", str(len(body)))
        self.end_headers()
        self.wfile.write(body)


server = http.server.ThreadingHTTPServer(("127.0.0.1", int(PORT)), Service)
BASE = f"https://127.0.0.1:{server.server_port}"
tls = ssl.create_default_context(ssl.Purpose.CLIENT_AUTH)
tls.load_cert_chain(CERTIFICATE, KEY)
server.socket = tls.wrap_socket(server.socket, server_side=True, do_handshake_on_connect=False)
print(BASE + "/bag", flush=True)
server.serve_forever()
