#!/usr/bin/env python3
"""Tests of the lab of root among strangers: another user plants what it can, before and while the lab runs.

usage: lab_strangers_test.py TARVELLAB [unittest options]; ends with status 77 where it is not root
"""
import contextlib
import os
import pathlib
import shutil
import signal
import stat
import subprocess
import sys
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from lab_kernel import LabTest, files, lab, node_dir, run  # noqa: E402

stranger = 65534
tarvelctl = pathlib.Path(lab).with_name("tarvelctl")
table = node_dir + "nexus_provider_list"
secret = (bytes(64) + b"secret".ljust(64, b"\0")).ljust(264, b"\0")


class Strangers(LabTest):
    def setUp(self):
        super().setUp()
        self.directory.chmod(0o755)
        self.kernel = self.generate("--flows", 3, name="kernel").root
        self.victim, self.theirs = self.directory / "victim", self.directory / "theirs"
        for path in self.victim / "stats", self.victim / "94", self.theirs:
            path.mkdir(parents=True)
        (self.victim / "table").write_bytes(secret)
        (self.victim / "94/comm").write_bytes(b"secret\n")
        os.chown(self.theirs, stranger, stranger)
        self.before = self.listing(self.victim)

    def listing(self, top):
        return [(str(p), p.lstat().st_mode, p.lstat().st_mtime_ns) for p in sorted(top.rglob("*"))]

    @contextlib.contextmanager
    def meanwhile(self, act):
        """The stranger acts again and again; what fails it tries the next time."""
        child = os.fork()
        if child == 0:
            os.setgroups([]), os.setgid(stranger), os.setuid(stranger)
            while True:
                with contextlib.suppress(OSError):
                    act()
        try:
            yield
        finally:
            os.kill(child, signal.SIGKILL)
            os.waitpid(child, 0)

    def lab_on(self, place, root=None, refused=None):
        """Every command that makes or enters `place`; a refusal says why, at once."""
        env = {**os.environ, "TARVEL_ROOT": str(root or self.kernel)}
        for words in (["generate", place], ["simulate", place], ["capture", place], ["capture", "--redact", place], ["run", place, "--", "true"]):
            with self.subTest(words):
                done = subprocess.run(["timeout", "-s", "INT", "0.3", lab, *words] if refused is None else [lab, *words],
                                      env=env, capture_output=True, text=True, timeout=10)
                if refused:
                    self.assertEqual((done.returncode, done.stderr), (1, f"tarvellab: {refused}\n"))
                    self.assertEqual(self.listing(self.victim), self.before)

    def test_DirectoriesOfOthersAreRefused(self):
        place = self.directory / "place"
        self.lab_on(self.theirs, refused=f"{self.theirs}: belongs to another user")
        self.assertEqual(list(self.theirs.iterdir()), [])
        for mode in 0o775, 0o757:
            place.mkdir()
            place.chmod(mode)
            self.lab_on(place, refused=f"{place}: others may write to it")
            self.assertEqual(list(place.iterdir()), [])
            place.rmdir()
        for below in "proc", "proc/sys/kern/tarvel", node_dir + "stats":
            shutil.copytree(self.kernel, place)
            os.chown(place / below, stranger, stranger)
            for words in ["generate", place], ["simulate", place], ["run", place, "--", "true"]:
                self.assertEqual(run(*words).stderr, f"tarvellab: {place / below}: belongs to another user\n")
            self.assertEqual(files(place), files(self.kernel))
            shutil.rmtree(place)

    def test_PlantedLinksAndPipesLeadNowhere(self):
        for below, target in ("proc", "."), (node_dir + "stats", "stats"), ("proc/94", "94"):
            place = self.directory / "place"
            shutil.copytree(self.kernel, place)
            (place / below).rename(self.directory / "aside")
            (place / below).symlink_to(self.victim / target)
            for words in ["generate", place], ["simulate", place]:
                self.assertEqual(run(*words).stderr, f"tarvellab: {place / below}: Not a directory\n")
            self.assertRegex(run("run", place, "--", "true").stderr, f"{place / below}: (no part of a capture|Not a directory)\n")
            self.assertEqual(self.listing(self.victim), self.before)
            shutil.rmtree(place), shutil.rmtree(self.directory / "aside")
        for name in "stats/flow", "stats/.flow":
            (self.kernel / node_dir / name).unlink(missing_ok=True)
            os.mkfifo(self.kernel / node_dir / name)
        self.assertEqual(run("generate", self.kernel).stderr, "")

    def test_NothingReachesAPlaceThatIsExchangedMeanwhile(self):
        place, aside = self.theirs / "place", self.theirs / "aside"

        def exchange():
            with contextlib.suppress(OSError):
                place.rename(aside / str(os.urandom(4).hex()))
            os.symlink(self.victim, place)
            place.unlink()
            place.mkdir()
            (place / "proc").symlink_to(self.victim)
            shutil.rmtree(place)
        with self.meanwhile(lambda: (aside.mkdir(exist_ok=True), exchange())):
            for _ in range(12):
                self.lab_on(place)
        self.assertEqual(self.listing(self.victim), self.before)
        for path in self.theirs.rglob("*"):
            status = path.lstat()
            if status.st_uid == 0:  # made by the lab: closed to others, and in nothing that is theirs but the named place
                self.assertEqual(stat.S_IMODE(status.st_mode), 0o700 if path.is_dir() else 0o600, path)
                self.assertTrue(path.parent in (self.theirs, aside) or path.parent.lstat().st_uid == 0, path)

    def test_AStrangersKernelShowsNothingButItsOwnFiles(self):
        shutil.copytree(self.kernel, self.theirs / "kernel")
        for path in self.theirs.rglob("*"):
            os.chown(path, stranger, stranger)
        tarvel, name = (self.theirs / "kernel" / table).parent, pathlib.Path(table).name
        (self.victim / name).write_bytes(secret)

        def exchange():
            for make in os.mkfifo, lambda path: os.symlink(self.victim / "table", path):
                with contextlib.suppress(OSError):
                    make(tarvel / "new")
                    os.rename(tarvel / "new", tarvel / name)
            tarvel.rename(tarvel.with_name("aside"))
            tarvel.symlink_to(self.victim)
            tarvel.unlink()
            tarvel.with_name("aside").rename(tarvel)
        seen = ""
        with self.meanwhile(exchange):
            for number in range(60):
                seen += subprocess.run([tarvelctl, "provider"], env={**os.environ, "TARVEL_ROOT": str(self.theirs / "kernel")},
                                       capture_output=True, text=True, timeout=10).stdout
                run("capture", self.directory / f"saved{number}", env={**os.environ, "TARVEL_ROOT": str(self.theirs / "kernel")})
        self.assertNotIn("secret", seen)
        self.assertEqual([path for path, content in files(self.directory).items() if path.startswith("saved") and b"secret" in content], [])


if __name__ == "__main__":
    if os.geteuid() != 0:
        print("skipped: another user can be tried by root only")
        sys.exit(77)
    unittest.main()
