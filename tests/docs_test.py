#!/usr/bin/env python3
"""Runs what the pages show and compares it with what they say, so that a reader who types it along sees the same.

usage: docs_test.py FOLDER_OF_THE_PROGRAMS [unittest options]

In a console block a line behind "$ " is a command, which "> " goes on with, and the lines below it are what it prints:
  ...      stands for lines left out, or inside a line for text left out
  ^C       interrupts the command, which has printed what is shown above
Tabs are shown as blanks. A simulation moves: where a command makes one, a number stands for any number. The commands of
a page run one after the other in an empty folder and end with status 0; messages count as printed. Pages of the manual
see the lab's kernel, and nothing is run of a block in which root, "# ", has the word.
"""
import os
import pathlib
import re
import signal
import subprocess
import sys
import tempfile
import time
import unittest

top = pathlib.Path(__file__).resolve().parent.parent
programs = pathlib.Path(sys.argv.pop(1)).resolve()
pages = [top / "README.md", top / "CONTRIBUTING.md", *sorted((top / "docs").glob("*.*"))]
number = r" *\b\d+(?:\.\d+)?[KMGT]?B?\b"


def commands(page):
    """The commands of a page in order, as (line of the page, command, shown lines)."""
    found, console = [], False
    for place, line in enumerate(page.read_text().expandtabs().replace(r"\(aq", "'").splitlines(), 1):
        if line.startswith(("```", ".Bd -literal", ".Ed", "# ")):
            console = line in ("```console", ".Bd -literal")
        elif console and line.startswith("$ "):
            found.append((place, line[2:], []))
        elif console and line.startswith("> ") and not found[-1][2]:
            found[-1] = (found[-1][0], found[-1][1] + "\n" + line[2:], [])
        elif console:
            found[-1][2].append(line)
    return found


def pattern(shown, moves):
    """What the whole output must match. Between lines left out, a piece matches at its first place."""
    def line_pattern(line):
        parts = [re.split(number, part) if moves else [part] for part in line.split("...")]
        return ".*".join(number.join(map(re.escape, part)) for part in parts) + "\n"

    first, *others = [[line_pattern(line) for line in piece.splitlines()]
                      for piece in re.split(r"^\.\.\.$\n?", "".join(line + "\n" for line in shown), flags=re.M)]
    skip = r"(?:.*\n)*?"
    middle = ["(?>" + skip + "".join(piece) + ")" for piece in others[:-1]]
    return re.compile("".join(first + middle) + (skip + "".join(others[-1]) if others else ""))


class Docs(unittest.TestCase):
    def run_command(self, command, folder, env, shown=None):
        """What the command prints. With a pattern, it is interrupted when its output matches."""
        with open(folder / "out", "w") as out:
            process = subprocess.Popen(["bash", "-c", command], cwd=folder / "cwd", env=env, stdin=subprocess.DEVNULL,
                                       stdout=out, stderr=out)
            self.addCleanup(process.kill)
        printed = lambda: re.sub(" +$", "", (folder / "out").read_text().expandtabs(), flags=re.M)
        end = time.monotonic() + 30
        while shown and not shown.fullmatch(printed()) and time.monotonic() < end:
            time.sleep(0.1)
        if shown:
            process.send_signal(signal.SIGINT)
        self.assertEqual(process.wait(30), 0, printed())
        return printed()

    def check_page(self, page, folder):
        (folder / "cwd").mkdir(), (folder / "tmp").mkdir()
        env = {**os.environ, "PATH": f"{programs}:{os.environ['PATH']}", "TMPDIR": str(folder / "tmp"),
               "LC_ALL": "C.UTF-8"}
        env.pop("TARVEL_ROOT", None)
        if page.suffix != ".md":
            subprocess.run([programs / "tarvellab", "generate", folder / "kernel"], check=True)
            env["TARVEL_ROOT"] = str(folder / "kernel")
        for place, command, shown in commands(page):
            if export := re.fullmatch(r"(?:export )?(\w+)=([\w/]+)", command):
                env[export[1]] = export[2]
                continue
            with self.subTest(f"{page.name}:{place}: {command}"):
                endless = shown[-1:] == ["^C"]
                expected = pattern(shown[:-1] if endless else shown, "tarvellab run -" in command)
                printed = self.run_command(command, folder, env, expected if endless else None)
                self.assertTrue(expected.fullmatch(printed), "It prints:\n" + printed[:20000])
        self.assertEqual(list((folder / "tmp").iterdir()), [])

    def test_CommandsPrintWhatThePagesShow(self):
        self.assertTrue(commands(top / "README.md"))
        for page in pages:
            with tempfile.TemporaryDirectory() as folder:
                self.check_page(page, pathlib.Path(folder))

    def test_ReadmeNamesEveryCommand(self):
        usage = subprocess.run([programs / "tarvelctl"], capture_output=True, text=True).stderr
        names = re.findall(r"^\t([a-z-]+)$", usage, re.M)
        self.assertTrue(names)
        self.assertEqual([name for name in names if f"`{name}`" not in (top / "README.md").read_text()], [])

    def test_LinksLeadSomewhere(self):
        for page in pages:
            for target, heading in re.findall(r"\]\((?!\w+:)([^)#]*)#?([^)]*)\)", page.read_text()):
                with self.subTest(f"{page.name}: {target}#{heading}"):
                    path = page.parent / target if target else page
                    self.assertTrue(path.exists())
                    titles = re.findall(r"^#+ (.*)$", path.read_text(), re.M) if heading else []
                    slugs = [re.sub(r"[^\w -]", "", title.lower()).replace(" ", "-") for title in titles]
                    self.assertTrue(not heading or heading in slugs)


if __name__ == "__main__":
    unittest.main()
