#!/usr/bin/env python3
"""A plain HTTP server of .ics and .vcf files for the refresh tests, on 127.0.0.1 only.

  collection_server.py ROOT PORT_FILE REQUEST_LOG

Serves the files of ROOT with an ETag (a hash of the content) and answers 304 to an
If-None-Match that matches it. Writes the port it got to PORT_FILE, and one JSON line per
request to REQUEST_LOG: the path, the If-None-Match it carried and the status it got. A file
NAME.mode next to NAME changes how NAME is served:
  cut    Content-Length twice the body's, half the body, then the connection closes
  login  a 200 text/html sign-in page, as a web application in front of the collection sends
"""
import hashlib
import http.server
import json
import os
import sys

root, port_file, log_file = sys.argv[1:4]


class Handler(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"

    def log_message(self, *args):
        pass

    def answer(self, status, headers, body=b""):
        with open(log_file, "a") as log:
            log.write(json.dumps({"path": self.path, "status": status,
                                  "if-none-match": self.headers.get("If-None-Match")}) + "\n")
        self.send_response(status)
        for name, value in headers.items():
            self.send_header(name, value)
        self.end_headers()
        self.wfile.write(body)

    def do_GET(self):
        path = os.path.join(root, self.path.lstrip("/"))
        mode = ""
        if os.path.exists(path + ".mode"):
            with open(path + ".mode") as f:
                mode = f.read().strip()
        try:
            with open(path, "rb") as f:
                body = f.read()
        except OSError:
            return self.answer(404, {"Content-Length": "0"})
        if mode == "login":
            page = b"<!DOCTYPE html><html><body><form>Sign in</form></body></html>"
            return self.answer(200, {"Content-Type": "text/html", "Content-Length": str(len(page))},
                               page)
        etag = '"%s"' % hashlib.sha256(body).hexdigest()[:16]
        if self.headers.get("If-None-Match") == etag:
            return self.answer(304, {"ETag": etag})
        kind = "text/vcard" if path.endswith(".vcf") else "text/calendar"
        if mode == "cut":
            self.close_connection = True
            return self.answer(200, {"Content-Type": kind, "ETag": etag,
                                     "Content-Length": str(2 * len(body))}, body[:len(body) // 2])
        self.answer(200, {"Content-Type": kind, "ETag": etag, "Content-Length": str(len(body))},
                    body)


server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), Handler)
with open(port_file + ".part", "w") as f:
    f.write(str(server.server_address[1]))
os.rename(port_file + ".part", port_file)
server.serve_forever()
