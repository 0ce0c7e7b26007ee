#!/usr/bin/python3
"""A stand-in for the recording system's web front end, for the demo.

Listens on 127.0.0.1 (port 0 picks a free one) and prints "PORT <n>" once it
accepts connections. "/login.web?output=json" answers with the list of known
recording systems, which holds the one with --serial; "/advanced.web" answers
with a page that shows the search a link carries in its fragment. Every
request line is appended to --log. Runs until killed.
"""
import argparse
import http.server
import json
import sys

PAGE = """<!DOCTYPE html>
<html><head><meta charset="utf-8"><title>Recording search</title></head>
<body><h1>Recording search</h1>
<p>The alert e-mail's link reached the web front end. The search it carries:</p>
<pre id="search"></pre>
<script>
var text = atob(location.hash.substring(1));
try { text = JSON.stringify(JSON.parse(text), null, 2); } catch (e) {}
document.getElementById("search").textContent = text;
</script></body></html>
"""


def make_handler(serial, log_path):
    class Handler(http.server.BaseHTTPRequestHandler):
        def do_GET(self):
            with open(log_path, "a") as log:
                log.write(self.requestline + "\n")
            if self.path == "/login.web?output=json":
                systems = {"list": [{"id": "1", "serial": serial, "model": "Demo recorder",
                                     "name": "Demo recording server"}]}
                self.reply(200, "application/json", json.dumps(systems))
            elif self.path.startswith("/advanced.web"):
                self.reply(200, "text/html; charset=utf-8", PAGE)
            else:
                self.reply(404, "text/plain", "not found\n")

        def reply(self, status, content_type, body):
            data = body.encode()
            self.send_response(status)
            self.send_header("Content-Type", content_type)
            self.send_header("Content-Length", str(len(data)))
            self.end_headers()
            self.wfile.write(data)

        def log_message(self, *args):
            pass

    return Handler


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--serial", required=True)
    parser.add_argument("--log", required=True)
    parser.add_argument("--port", type=int, default=0)
    args = parser.parse_args()
    server = http.server.HTTPServer(("127.0.0.1", args.port), make_handler(args.serial, args.log))
    print("PORT %d" % server.server_address[1], flush=True)
    try:
        server.serve_forever()
    except KeyboardInterrupt:
        sys.exit(0)


if __name__ == "__main__":
    main()
