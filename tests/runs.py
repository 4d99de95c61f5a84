"""What tests of whole programs share: the programs of a build, which is their first argument, and runs of them."""
import collections
import contextlib
import functools
import os
import pathlib
import pty
import re
import resource
import shlex
import shutil
import signal
import socket
import subprocess
import sys
import tempfile
import threading
import time
import tty
import unittest

from records import Kernel, load

build = pathlib.Path(sys.argv.pop(1)).resolve()
top = pathlib.Path(__file__).parents[1]
tarvelctl, tarvellab, tarvelexport = (str(build / name) for name in ("tarvelctl", "tarvellab", "tarvelexport"))
load(build / "tests/describe")

signal.signal(signal.SIGINT, signal.SIG_DFL)  # what is started neither ignores it nor, while it starts, catches it
MISSING = "sysctl for len failed, No such file or directory\n"
SHORT = "Buffer too short\n"
TIME = re.compile(r"\d{4}-\d\d-\d\d \d\d:\d\d:\d\d")

# What a run left behind: outputs are texts, with stray bytes as surrogates; status -N is the end by signal N.
Result = collections.namedtuple("Result", "out err status")


def text(data):
    return data.decode("utf-8", "surrogateescape")


def wait_for(condition, seconds=60):
    """Returns what a condition is once it holds. Nothing that works takes so long."""
    end = time.monotonic() + seconds
    while not (found := condition()):
        assert time.monotonic() < end, "what is waited for does not come"
        time.sleep(0.002)
    return found


def ends(to):
    """What a program writes to, and where a test reads it: a pipe, a socket, a terminal, or the path of a file."""
    if to == "pipe":
        return os.pipe()[::-1]
    if to == "socket":
        return tuple(end.detach() for end in socket.socketpair())
    if to == "terminal":
        test, program = pty.openpty()
        tty.setraw(program)  # line ends arrive as they were written
        return program, test
    return os.open(to, os.O_WRONLY), os.open("/dev/null", os.O_RDONLY)


class Run:
    """A program that runs on a kernel. Both outputs are read as they come.

    Options beside those of Popen: `to`, where standard output leads; `merged`, standard error leads there too;
    `name`, in place of the program's path; `closed`, descriptors; `environment`, beside the kernel's.
    """

    def __init__(self, words, kernel, to="pipe", merged=False, name=None, closed=(), environment=None, **options):
        program, self.reader = ends(to)
        errors, errors_program = os.pipe()
        environment = {**kernel.environment, "LC_ALL": "C", **(environment or {})}
        options.setdefault("preexec_fn", lambda: [os.close(fd) for fd in closed] if closed else None)
        self.process = subprocess.Popen([name or words[0], *words[1:]], executable=words[0], env=environment,
                                        stdin=subprocess.DEVNULL, stdout=program,
                                        stderr=program if merged else errors_program, **options)
        os.close(program), os.close(errors_program)
        self.data = {self.reader: bytearray(), errors: bytearray()}
        self.threads = [threading.Thread(target=self.read, args=[fd], daemon=True) for fd in self.data]
        for thread in self.threads:
            thread.start()

    def read(self, fd):
        with contextlib.suppress(OSError):  # how a terminal ends
            while got := os.read(fd, 1 << 16):
                self.data[fd] += got
        os.close(fd)

    @property
    def out(self):
        return text(bytes(self.data[self.reader]))

    @property
    def err(self):
        return text(bytes([*self.data.values()][1]))

    def wait(self, part, times=1):
        """Returns once a text has appeared so often on the two outputs together."""
        wait_for(lambda: self.out.count(part) + self.err.count(part) >= times or self.process.poll() is not None)

    def end(self, number=None, seconds=60):
        """What the program left behind, which is sent a signal first where one is given."""
        if number:
            self.process.send_signal(number)
        try:
            status = self.process.wait(seconds)
        except subprocess.TimeoutExpired:
            self.process.kill()
            status = self.process.wait() and "does not end"
        for thread in self.threads:
            thread.join()
        return Result(self.out, self.err, status)


def files(root):
    """The contents of all files below a folder, by path."""
    return {str(p.relative_to(root)): p.read_bytes() for p in sorted(pathlib.Path(root).rglob("*")) if p.is_file()}


def hidden(root):
    return [path for path in files(root) if "/." in path]


def remove(path):
    """Whatever it is. What a link leads to stays."""
    shutil.rmtree(path) if path.is_dir() and not path.is_symlink() else path.unlink()


def limit_files(size):
    """For a process that is about to start: no file grows beyond a size."""
    resource.setrlimit(resource.RLIMIT_FSIZE, (size, resource.RLIM_INFINITY))


def preloaded(module, **variables):
    """The environment of a program that loads something of ours first: see MODULE.cpp for its variables."""
    sanitizer = os.environ.get("ASAN_OPTIONS", "") + ":verify_asan_link_order=0"
    return {"LD_PRELOAD": str(build / f"tests/lib{module}.so"), "ASAN_OPTIONS": sanitizer, **variables}


name_services = functools.partial(preloaded, "name_services")


def generate(root, *options):
    """A kernel that the lab makes."""
    subprocess.run([tarvellab, "generate", root, *map(str, options)], check=True)
    return Kernel(root)


def aborted(function, line, expression, out="", file="tarvelctl/tarvelctl"):
    """A run that ends at the invariant of an inconsistent table, after the report in front of it."""
    said = f"Assertion failed: ({expression}), function {function}, file {file}, line {line}.\n"
    return Result(out, said, -signal.SIGABRT)


class Case(unittest.TestCase):
    """Whole commands in the folder `self.directory`, on `self.kernel`: no tables yet, and curl as process 42."""
    maxDiff = None

    def setUp(self):
        self.directory = pathlib.Path(tempfile.mkdtemp(prefix="tarvel_test"))
        self.addCleanup(shutil.rmtree, self.directory, ignore_errors=True)
        self.directory.chmod(0o755)  # for tests that give up their rights
        self.kernel = Kernel(self.directory / "kernel")
        self.kernel.process(42, "curl")

    def start(self, line, program=tarvelctl, kernel=None, **options):
        """A program under way. The line is a text, as a shell splits it, or a list of words."""
        words = shlex.split(line) if isinstance(line, str) else [*map(str, line)]
        run = Run([program, *words], kernel or self.kernel, **{"cwd": self.directory, **options})
        self.addCleanup(lambda: run.process.poll() is None and run.process.kill())
        return run

    def put(self, tables):
        for name, contents in tables.items():
            self.kernel.put(name, contents)

    def run_on(self, tables, line, **options):
        """The result of a run to its end, on a kernel that gets these tables first."""
        self.put(tables)
        return self.start(line, **options).end()

    def expect(self, tables, line, out="", err="", status=0, **options):
        """Runs a command line, or several, each of which leaves just this behind."""
        expected = Result(out, err, status) if isinstance(out, str) else out
        for each in [line] if isinstance(line, str) else line:
            with self.subTest(line=each):
                seen = self.run_on(tables, each, **options)
                self.assertEqual(seen._replace(out=TIME.sub("<time>", seen.out)), expected)

    def watch(self, line, *tables):
        """What a watch leaves behind whose runs get these tables, one after the other, and which an interrupt ends. On
        standard error it tells of its sleeps."""
        self.put(tables[0])
        run = self.start(line, environment=preloaded("own_clock"))
        for number, each in enumerate(tables[1:], 1):
            run.wait("sleep ", number)
            self.put(each)
            run.process.send_signal(signal.SIGALRM)
        run.wait("sleep ", len(tables))
        seen = run.end(signal.SIGINT)
        return seen._replace(out=TIME.sub("<time>", seen.out))


class LabCase(Case):
    """The lab, which sees `self.kernel` as its kernel."""

    def lab(self, line, **options):
        """What a run of it leaves behind."""
        return self.start(line, tarvellab, **options).end()

    def simulated(self, options, intervals, late=0):
        """The kernel so many intervals later, each of which comes so many ms late."""
        waits = preloaded("no_entropy", WAITS=str(intervals + 1), LATE=str(late))
        self.assertEqual(self.lab(f"simulate kernel {options}", environment=waits), ("simulating in kernel\n", "", 0))
        return self.kernel
