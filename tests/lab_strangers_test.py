"""The lab of root among strangers, who plant what they can before and while it runs."""
import contextlib
import os
import shutil
import signal
import subprocess
import unittest

from records import NODES, Kernel, make
from runs import LabCase, files, generate, tarvellab

STRANGER = 65534
MAKING = "generate {}", "simulate {}", "run {} -- true"
ALL = *MAKING, "capture {}", "capture --redact {}"


@unittest.skipIf(os.geteuid(), "another user can be tried by root only")
class Strangers(LabCase):
    def setUp(self):
        super().setUp()
        generate(self.kernel.root, "--flows", 3)
        self.victim, self.theirs, self.place = (self.directory / name for name in ("victim", "theirs", "place"))
        for path in self.victim / "stats", self.victim / "94", self.theirs:
            path.mkdir(parents=True)
        (self.victim / "nexus_provider_list").write_bytes(make("nexus_provider_record", name="secret", name_length=6))
        os.chown(self.theirs, STRANGER, STRANGER)
        self.before = self.listing()

    def listing(self):
        return [(str(path), path.lstat().st_mode, path.lstat().st_mtime_ns) for path in sorted(self.victim.rglob("*"))]

    def said(self, place, lines, kernel=None, seconds=60):
        """What runs say that make or enter a place. What goes on behind that time is ended."""
        def said_by(run):
            with contextlib.suppress(subprocess.TimeoutExpired):
                run.process.wait(seconds)
            return run.end(signal.SIGINT).err
        return {said_by(self.start(line.format(place), tarvellab, kernel=kernel)) for line in lines}

    def stranger(self, *acts):
        """A child that acts again and again; what fails now may work the next time."""
        child = os.fork()
        if child:
            self.addCleanup(os.waitpid, child, 0)
            self.addCleanup(os.kill, child, signal.SIGKILL)
        while not child:
            os.getuid() or (os.setgroups([]), os.setgid(STRANGER), os.setuid(STRANGER))
            for act in acts:
                with contextlib.suppress(OSError):
                    act()

    def test_WhatIsNotTheCallersAloneIsRefused(self):
        self.assertEqual(self.said(self.theirs, ALL), {f"tarvellab: {self.theirs}: belongs to another user\n"})
        for mode in 0o775, 0o757:
            self.place.mkdir()
            self.place.chmod(mode)
            self.assertEqual(self.said(self.place, ALL), {f"tarvellab: {self.place}: others may write to it\n"})
            self.place.rmdir()  # empty
        self.assertEqual([*self.theirs.iterdir()], [])
        shutil.copytree(self.kernel.root, self.place)
        for below in self.place / NODES / "stats", self.place / "proc":
            os.chown(below, STRANGER, STRANGER)
            self.assertEqual(self.said(self.place, MAKING), {f"tarvellab: {below}: belongs to another user\n"})
        self.assertEqual(files(self.place), files(self.kernel.root))

    def test_PlantedLinksAndPipesLeadNowhere(self):
        for below, target in ("proc", "."), (NODES + "stats", "stats"), ("proc/94", "94"):
            shutil.copytree(self.kernel.root, self.place)
            shutil.rmtree(self.place / below)
            (self.place / below).symlink_to(self.victim / target)
            reasons = "Not a directory", "no part of a capture"
            said = {f"tarvellab: {self.place / below}: {reason}\n" for reason in reasons}
            self.assertLessEqual(self.said(self.place, MAKING), said)
            shutil.rmtree(self.place)
        self.assertEqual(self.listing(), self.before)
        self.kernel.path("stats/flow").unlink()
        os.mkfifo(self.kernel.path("stats/flow"))
        self.assertEqual(self.said(self.kernel.root, ["generate {}"]), {""})

    def test_NothingReachesOrShowsWhatIsExchangedMeanwhile(self):
        place, aside = self.theirs / "place", self.theirs / "aside"
        kernel = Kernel(shutil.copytree(self.kernel.root, self.theirs / "kernel"))
        aside.mkdir()
        for path in self.theirs.rglob("*"):
            os.chown(path, STRANGER, STRANGER)
        folder, table = kernel.path(""), kernel.path("nexus_provider_list")

        def exchange_place():
            with contextlib.suppress(OSError):
                place.rename(aside / os.urandom(4).hex())
            place.symlink_to(self.victim)
            place.unlink()
            place.mkdir()
            (place / "proc").symlink_to(self.victim)
            shutil.rmtree(place)

        def exchange_table(plant):
            plant(folder / "new")
            (folder / "new").rename(table)

        def exchange_folder():
            folder.rename(folder.with_name("aside"))
            folder.symlink_to(self.victim)
            folder.unlink()
            folder.with_name("aside").rename(folder)
        self.stranger(exchange_place, lambda: exchange_table(os.mkfifo), exchange_folder,
                      lambda: exchange_table(lambda path: path.symlink_to(self.victim / table.name)))
        seen = ""
        for number in range(60):
            seen += self.start("provider", kernel=kernel).end().out
            self.said(self.directory / f"saved{number}", ["capture {}"], kernel)
            self.said(place, [ALL[number % 5]], seconds=.3)
        saved = [files(path) for path in self.directory.glob("saved*")]
        self.assertNotIn("secret", seen + str(saved))
        self.assertEqual(self.listing(), self.before)
        for path in [*place.rglob("*"), *aside.rglob("*")]:
            if path.lstat().st_uid == 0:  # made by the lab: closed to others, in nothing of theirs but the named place
                self.assertEqual(path.lstat().st_mode & 0o777, 0o700 if path.is_dir() else 0o600, path)
                self.assertTrue(path.parent in (self.theirs, aside) or path.parent.lstat().st_uid == 0, path)
