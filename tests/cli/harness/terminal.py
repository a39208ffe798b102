"""A program of a box on a terminal of its own.

    terminal = Terminal(box, ["vvstat", "-w"], columns=200)      its output is a terminal
    terminal = Terminal(box, ["vv", ...], whole=True)            input, output and /dev/tty are
    terminal.wait_for("[y/N] ")                                  waits until that text was shown
    terminal.type("y\\n")
    terminal.end()                                               waits for the end; gives the exit status
    terminal.text                                                all that was shown
    terminal.shows_what_is_typed()
"""

import fcntl
import os
import pty
import struct
import termios

from .world import Running


class Terminal:
    def __init__(self, box, argv, *, columns=80, lines=24, env=None, keys=False, whole=False):
        self.box, self.text = box, ""
        self.master, slave = pty.openpty()
        fcntl.ioctl(slave, termios.TIOCSWINSZ, struct.pack("HHHH", lines, columns, 0, 0))
        if whole:  # the terminal of a session of its own, with an interrupt key that works
            argv = ["/usr/bin/setsid", "--ctty", "--wait", "env", "--default-signal=INT", *argv]
        number = next(box.numbers)
        err = os.memfd_create("err", os.MFD_CLOEXEC)
        self.running = box.running[number] = Running(box, number, argv, os.memfd_create("unused", os.MFD_CLOEXEC), err)
        box.recorder.started(self.running)
        stdin = os.dup(slave) if keys or whole else os.open("/dev/null", os.O_RDONLY)
        variables = [f"{name}={value}" for name, value in box.env(env).items()]
        box.send(["run", number, "/", len(argv), *argv, *variables], [stdin, slave, slave if whole else err])
        for fd in (stdin, slave):
            os.close(fd)
        os.set_blocking(self.master, False)

    def read(self):
        try:
            while data := os.read(self.master, 65536):
                self.text += data.decode()
        except OSError:
            pass
        return self.text

    def type(self, keys):
        os.write(self.master, keys.encode())

    def wait_for(self, text):
        self.box.wait_until(lambda: text in self.read(), what=f"{text!r} in {self.text!r}")

    def end(self):
        status = self.running.wait().status
        self.box.recorder.shown(self.running, self.read())
        os.close(self.master)
        return status

    def shows_what_is_typed(self):
        return bool(termios.tcgetattr(self.master)[3] & termios.ECHO)
