#!/usr/bin/env python3
"""Tests of the lab of root among strangers: another user plants what it can, before and while the lab runs.

usage: lab_strangers_test.py TARVELLAB [unittest options]; ends with status 77 where it is not root
"""
import contextlib
import os
import pathlib
import shutil
import signal
import subprocess
import sys
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from lab_kernel import LabTest, files, lab, node_dir  # noqa: E402

stranger = 65534
tarvelctl = pathlib.Path(lab).with_name("tarvelctl")
secret = (bytes(64) + b"secret".ljust(64, b"\0")).ljust(264, b"\0")


class Strangers(LabTest):
    def setUp(self):
        super().setUp()
        self.directory.chmod(0o755)
        self.kernel = self.generate("--flows", 3, name="kernel").root
        self.victim, self.theirs, self.place = (self.directory / name for name in ("victim", "theirs", "place"))
        for path in self.victim / "stats", self.victim / "94", self.theirs:
            path.mkdir(parents=True)
        (self.victim / "nexus_provider_list").write_bytes(secret)
        os.chown(self.theirs, stranger, stranger)
        self.before = self.listing(self.victim)

    def listing(self, top):
        return [(str(p), p.lstat().st_mode, p.lstat().st_mtime_ns) for p in sorted(top.rglob("*"))]

    @contextlib.contextmanager
    def meanwhile(self, act):
        """The stranger acts again and again; what fails now may work the next time."""
        child = os.fork()
        while child == 0:
            with contextlib.suppress(OSError):
                os.getuid() or (os.setgroups([]), os.setgid(stranger), os.setuid(stranger))
                act()
        try:
            yield
        finally:
            os.kill(child, signal.SIGKILL)
            os.waitpid(child, 0)

    def run_on(self, place, *commands, kernel=None, seconds="20"):
        """What is printed by commands that make or enter a place. What moves is ended, without a SIGCONT too: the leak
        check at its end would wait for the stop that this undoes."""
        for command in commands:
            words = [place if word == "DIR" else word for word in command.split()]
            yield subprocess.run(["timeout", "--foreground", "-s", "INT", seconds, lab, *words], capture_output=True, text=True, timeout=60,
                                 env={**os.environ, "TARVEL_ROOT": str(kernel or self.kernel)}).stderr

    made, run_there = ("generate DIR", "simulate DIR"), "run DIR -- true"
    all = *made, "capture DIR", "capture --redact DIR", run_there

    def test_WhatIsNotTheCallersAloneIsRefused(self):
        self.assertEqual({*self.run_on(self.theirs, *self.all)}, {f"tarvellab: {self.theirs}: belongs to another user\n"})
        for mode in 0o775, 0o757:
            self.place.mkdir()
            self.place.chmod(mode)
            self.assertEqual({*self.run_on(self.place, *self.all)}, {f"tarvellab: {self.place}: others may write to it\n"})
            self.place.rmdir()  # empty
        self.assertEqual([*self.theirs.iterdir()], [])
        shutil.copytree(self.kernel, self.place)
        for below in node_dir + "stats", "proc":
            os.chown(self.place / below, stranger, stranger)
            self.assertEqual({*self.run_on(self.place, *self.made, self.run_there)}, {f"tarvellab: {self.place / below}: belongs to another user\n"})
        self.assertEqual(files(self.place), files(self.kernel))

    def test_PlantedLinksAndPipesLeadNowhere(self):
        for below, target in ("proc", "."), (node_dir + "stats", "stats"), ("proc/94", "94"):
            shutil.copytree(self.kernel, self.place)
            shutil.rmtree(self.place / below)
            (self.place / below).symlink_to(self.victim / target)
            for seen in self.run_on(self.place, *self.made, self.run_there):
                self.assertRegex(seen, f"^tarvellab: {self.place / below}: (no part of a capture|Not a directory)\n$")
            shutil.rmtree(self.place)
        self.assertEqual(self.listing(self.victim), self.before)
        (self.kernel / node_dir / "stats/flow").unlink()
        os.mkfifo(self.kernel / node_dir / "stats/flow")
        self.assertEqual([*self.run_on(self.kernel, "generate DIR")], [""])

    def test_NothingReachesAPlaceThatIsExchangedMeanwhile(self):
        place, aside = self.theirs / "place", self.theirs / "aside"

        def exchange():
            aside.mkdir(exist_ok=True)
            with contextlib.suppress(OSError):
                place.rename(aside / os.urandom(4).hex())
            os.symlink(self.victim, place)
            place.unlink()
            place.mkdir()
            (place / "proc").symlink_to(self.victim)
            shutil.rmtree(place)
        with self.meanwhile(exchange):
            for _ in range(12):
                [*self.run_on(place, *self.all, seconds="0.3")]
        self.assertEqual(self.listing(self.victim), self.before)
        for path in self.theirs.rglob("*"):
            if path.lstat().st_uid == 0:  # made by the lab: closed to others, and in nothing that is theirs but the named place
                self.assertEqual(path.lstat().st_mode & 0o777, 0o700 if path.is_dir() else 0o600, path)
                self.assertTrue(path.parent in (self.theirs, aside) or path.parent.lstat().st_uid == 0, path)

    def test_AStrangersKernelShowsNothingButItsOwnFiles(self):
        kernel = shutil.copytree(self.kernel, self.theirs / "kernel")
        for path in self.theirs.rglob("*"):
            os.chown(path, stranger, stranger)
        tarvel, name = kernel / node_dir, "nexus_provider_list"

        def exchange():
            for make in os.mkfifo, lambda path: os.symlink(self.victim / name, path):
                with contextlib.suppress(OSError):
                    make(tarvel / "new")
                    os.rename(tarvel / "new", tarvel / name)
            tarvel.rename(tarvel.with_name("aside"))
            tarvel.symlink_to(self.victim)
            tarvel.unlink()
            tarvel.with_name("aside").rename(tarvel)
        seen = b""
        with self.meanwhile(exchange):
            for number in range(60):
                seen += subprocess.run([tarvelctl, "provider"], env={"TARVEL_ROOT": str(kernel)}, capture_output=True, timeout=10).stdout
                [*self.run_on(self.directory / f"saved{number}", "capture DIR", kernel=kernel)]
        saved = b"".join(content for path, content in files(self.directory).items() if path.startswith("saved"))
        self.assertNotIn(b"secret", seen + saved)


if __name__ == "__main__":
    if os.geteuid() != 0:
        print("skipped: another user can be tried by root only")
        sys.exit(77)
    unittest.main()
