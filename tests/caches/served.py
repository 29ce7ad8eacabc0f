"""A web server of this machine's own for tools that cache what they fetch."""
import contextlib
import functools
import http.server
import threading


class Cacheable(http.server.SimpleHTTPRequestHandler):
    """Says of everything that it may be kept. What is called "never" is asked for in vain."""
    released = threading.Event()

    def do_GET(self):
        if "never" in self.path.split("/"):
            self.server.asked_in_vain.set()
            self.released.wait()
            return
        super().do_GET()

    def end_headers(self):
        self.send_header("Cache-Control", "max-age=86400")
        super().end_headers()

    def log_message(self, *_):
        pass


@contextlib.contextmanager
def served(folder):
    """Serves it; answers the address and the server."""
    server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), functools.partial(Cacheable, directory=str(folder)))
    server.asked_in_vain = threading.Event()
    server.daemon_threads = True
    threading.Thread(target=server.serve_forever, daemon=True).start()
    try:
        yield f"http://127.0.0.1:{server.server_port}", server
    finally:
        Cacheable.released.set()
        server.shutdown()
        server.server_close()
        Cacheable.released.clear()
