#!/usr/bin/env python3
"""A demonstration printer: answers HTTP at 192.0.0.192, well or badly.

usage: printer.py MANNER LOGFILE

    well      a front page, a configuration page, and 404 for everything else
    silent    takes the connection and never answers
    redirect  to a page that does not exist

Every request line goes to LOGFILE.
"""
import http.server
import sys
import time

PAGES = {
    "/": "<h1>Demonstration printer</h1>\n<p>Ready. <a href=/dot11_config_start.htm>Set up</a></p>\n",
    "/dot11_config_start.htm": "<h1>Wireless set-up</h1>\n<p>Choose a network.</p>\n",
}


class Printer(http.server.BaseHTTPRequestHandler):
    def do_GET(self):
        with open(LOGFILE, "a", encoding="utf-8") as log:
            log.write(self.requestline + "\n")
        getattr(self, MANNER)()

    def answer(self, status, body=b"", **headers):
        self.send_response(status)
        self.send_header("Content-Length", str(len(body)))
        for name, value in headers.items():
            self.send_header(name, value)
        self.end_headers()
        self.wfile.write(body)

    def well(self):
        page = PAGES.get(self.path)
        self.answer(200 if page else 404, (page or "<h1>Not found</h1>\n").encode(), **{"Content-Type": "text/html"})

    def silent(self):
        time.sleep(3600)

    def redirect(self):
        self.answer(302 if self.path == "/mactestfoo.html" else 404, Location="http://192.0.0.192/moved.html")

    def log_message(self, *_):
        pass


if __name__ == "__main__":
    MANNER, LOGFILE = sys.argv[1:]
    http.server.ThreadingHTTPServer(("192.0.0.192", 80), Printer).serve_forever()
