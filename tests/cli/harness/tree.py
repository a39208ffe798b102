"""The configuration tree of a box, through the real daemon and the real client."""

import re

SOCKET = "/var/run/ktree_sock_vv"


class Tree:
    """The daemon is started by the first use of it: box.tree.get(...) or any program of the box."""

    def __init__(self, box, socket=SOCKET):
        self.box, self.socket = box, socket
        self.daemon = None

    def start(self, arguments=None):
        words = arguments or ["-n", "config", "-s", self.socket]
        self.daemon = self.box.start(["ktree", *words], env={"LD_PRELOAD": None}, own=True)
        self.box.wait_until(self._answers, what="the tree's daemon")
        return self

    def _answers(self):
        if self.daemon.result is not None:
            raise RuntimeError(f"ktree ended: {self.daemon.result}")
        return self.box.path(self.socket).is_socket() and self._client("-t").status != 3

    def stop(self):
        self.daemon.kill(15)
        self.daemon.wait()

    def restart(self):
        self.stop()
        self.start()

    def _client(self, *args, input=None):
        return self.box.run(["ktreec", "-S", self.socket, *args], env={"LD_PRELOAD": None}, input=input, own=True)

    def get(self, path):
        """The value at `path`, None when there is none."""
        done = self._client("-g", path)
        return done.stdout[:-1] if done.status == 0 else None

    def set(self, path, value=None):
        values = path if isinstance(path, dict) else {path: value}
        script = 'while [ $# -gt 0 ]; do ktreec -S "$0" -s "$1" "$2" || exit 1; shift 2; done'
        words = [str(word) for pair in values.items() for word in pair]
        done = self.box.run(["sh", "-c", script, self.socket, *words], env={"LD_PRELOAD": None}, own=True)
        assert done.status == 0, f"the tree refused {values}: {done.stderr}"

    def delete(self, path):
        done = self._client("-d", path)
        assert done.status == 0, f"the tree refused to delete {path}: {done.stderr}"

    def text(self):
        """All that it holds as the client prints it, "" when the daemon does not answer."""
        return self._client("-t").stdout

    def dump(self, path=""):
        """Every value below `path`, as a dict from whole path to value, in the tree's order."""
        done = self._client("-t", *([path] if path else []))
        assert done.status in (0, 1), done.stderr
        pairs = (re.split("=", line, maxsplit=1) for line in done.stdout.split("\n") if line)
        return {key: unescape_value(value) for key, value in pairs}


def unescape_value(text):
    raw = text.encode("utf-8", "surrogateescape")
    raw = re.sub(rb"\\x([0-9A-F]{2})", lambda m: bytes([int(m[1], 16)]), raw)
    return raw.decode("utf-8", "surrogateescape")
