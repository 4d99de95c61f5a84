"""Runs what the pages show and compares it with what they say, so that a reader who types it along sees the same.

In a console block a line behind "$ " is a command, which "> " goes on with, and the lines below it are what it prints:
  ...      stands for lines left out, or inside a line for text left out
  ^C       interrupts the command, which has printed what is shown above
Tabs are shown as blanks. A simulation moves: where a command makes one, a number stands for any number. The commands of
a page run one after the other in an empty folder and end with status 0; messages count as printed. Pages of the manual
see the lab's kernel, and nothing is run of a block from where root, "# ", has the word.
"""
import os
import pathlib
import re
import signal
import subprocess
import tempfile
import time
import unittest

from runs import build, tarvellab, top

pages = [top / "README.md", top / "CONTRIBUTING.md", *sorted((top / "docs").glob("*.*"))]
number = r" *\b\d+(?:\.\d+)?[KMGT]?B?\b"


def commands(page):
    """The commands of a page in order, each with what is shown below it."""
    text = page.read_text().expandtabs().replace(r"\(aq", "'")
    for block in re.findall(r"^(?:```console|\.Bd -literal)\n(.*?)^(?:```|\.Ed|# )", text, re.M | re.S):
        for command, shown in re.findall(r"^\$ (.*(?:\n> .*)*)\n((?:(?!\$ ).*\n)*)", block, re.M):
            yield command.replace("\n> ", "\n"), shown


def pattern(shown, moves):
    """What the whole output must match. Between lines left out, a piece matches at its first place."""
    def escaped(text):
        return number.join(map(re.escape, re.split(number, text) if moves else [text]))

    pieces = re.split(r"^\.\.\.$\n?", shown, flags=re.M)
    first, *others = [".*".join(map(escaped, piece.split("..."))) for piece in pieces]
    skip = r"(?:.*\n)*?"
    middle = "".join(f"(?>{skip}{piece})" for piece in others[:-1])
    return re.compile(first + middle + (skip + others[-1] if others else ""))


class Docs(unittest.TestCase):
    def run_command(self, command, folder, env, expected=None):
        """What the command prints. If that is expected of it, it is interrupted when it has printed so much."""
        def printed():
            return re.sub(" +$", "", (folder / "out").read_text().expandtabs(), flags=re.M)

        with open(folder / "out", "w") as out:
            process = subprocess.Popen(["bash", "-c", command], cwd=folder / "cwd", env=env, stdin=subprocess.DEVNULL,
                                       stdout=out, stderr=out)
        self.addCleanup(process.kill)
        if expected:
            end = time.monotonic() + 30
            while not expected.fullmatch(printed()) and time.monotonic() < end:
                time.sleep(0.1)
            process.send_signal(signal.SIGINT)
        self.assertEqual(process.wait(30), 0, printed())
        return printed()

    def check_page(self, page, folder):
        for name in "cwd", "tmp":
            (folder / name).mkdir()
        env = {**os.environ, "PATH": f"{build}:{os.environ['PATH']}", "TMPDIR": f"{folder}/tmp", "LC_ALL": "C.UTF-8"}
        env.pop("TARVEL_ROOT", None)
        if page.suffix != ".md":
            subprocess.run([tarvellab, "generate", folder / "kernel"], check=True)
            env["TARVEL_ROOT"] = str(folder / "kernel")
        for command, shown in commands(page):
            if export := re.fullmatch(r"(?:export )?(\w+)=([\w/]+)", command):
                env[export[1]] = export[2]
                continue
            with self.subTest(page=page.name, command=command):
                endless = shown.endswith("^C\n")
                expected = pattern(shown.removesuffix("^C\n"), "tarvellab run -" in command)
                printed = self.run_command(command, folder, env, expected if endless else None)
                self.assertTrue(expected.fullmatch(printed), "It prints:\n" + printed[:20000])
        self.assertEqual(list((folder / "tmp").iterdir()), [])

    def test_CommandsPrintWhatThePagesShow(self):
        self.assertTrue([*commands(top / "README.md")])
        for page in pages:
            self.check_page(page, pathlib.Path(self.enterContext(tempfile.TemporaryDirectory())))

    def test_LinksLeadSomewhere(self):
        for page in pages:
            for target, heading in re.findall(r"\]\((?!\w+:)([^)#]*)#?([^)]*)\)", page.read_text()):
                with self.subTest(page=page.name, target=target, heading=heading):
                    titles = re.findall(r"^#+ (.*)$", (page.parent / target if target else page).read_text(), re.M)
                    slugs = [re.sub(r"[^\w -]", "", title.lower()).replace(" ", "-") for title in titles]
                    self.assertIn(heading, ["", *slugs])
