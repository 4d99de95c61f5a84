"""Runs what the pages show and compares it with what they say, so that a reader who types it along sees the same.

In a console block a line behind "$ " is a command, which "> " goes on with, and the lines below it are what it prints:
  ...      stands for lines left out, or inside a line for text left out
  ^C       interrupts the command, which has printed what is shown above
Tabs are shown as blanks. A simulation moves: where a command makes one, a number stands for any number. The commands of
a page run one after the other in an empty folder and end with status 0; messages count as printed. Pages of the manual
see the lab's kernel, and nothing is run of a block from where root, "# ", has the word.
"""
import contextlib
import os
import re
import signal

from records import Kernel
from runs import Case, build, generate, top, wait_for

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


class Docs(Case):
    def run_command(self, command, kernel, folder, expected=None):
        """What the command prints. If that is expected of it, it is interrupted when it has printed so much."""
        def printed():
            return re.sub(" +$", "", run.out.expandtabs(), flags=re.M)

        run = self.start(["-c", command], "/bin/bash", kernel, merged=True, cwd=folder / "cwd",
                         environment={"LC_ALL": "C.UTF-8"})
        if expected:
            with contextlib.suppress(AssertionError):  # whatever it prints is looked at below
                wait_for(lambda: expected.fullmatch(printed()), 30)
        self.assertEqual(run.end(signal.SIGINT if expected else None).status, 0, printed())
        return printed()

    def check_page(self, page):
        kernel = Kernel(self.directory / page.name / "kernel")
        folder = kernel.root.parent
        for name in "cwd", "tmp":
            (folder / name).mkdir(parents=True)
        kernel.environment |= {"PATH": f"{build}:{os.environ['PATH']}", "TMPDIR": f"{folder}/tmp"}
        if page.suffix == ".md":
            kernel.environment.pop("TARVEL_ROOT")
        else:
            generate(kernel.root)
        for command, shown in commands(page):
            if export := re.fullmatch(r"(?:export )?(\w+)=([\w/]+)", command):
                kernel.environment[export[1]] = export[2]
                continue
            with self.subTest(page=page.name, command=command):
                endless = shown.endswith("^C\n")
                expected = pattern(shown.removesuffix("^C\n"), "tarvellab run -" in command)
                printed = self.run_command(command, kernel, folder, expected if endless else None)
                self.assertTrue(expected.fullmatch(printed), "It prints:\n" + printed[:20000])
        self.assertEqual(list((folder / "tmp").iterdir()), [])

    def test_CommandsPrintWhatThePagesShow(self):
        self.assertTrue([*commands(top / "README.md")])
        for page in pages:
            self.check_page(page)

    def test_LinksLeadSomewhere(self):
        for page in pages:
            for target, heading in re.findall(r"\]\((?!\w+:)([^)#]*)#?([^)]*)\)", page.read_text()):
                with self.subTest(page=page.name, target=target, heading=heading):
                    titles = re.findall(r"^#+ (.*)$", (page.parent / target if target else page).read_text(), re.M)
                    slugs = [re.sub(r"[^\w -]", "", title.lower()).replace(" ", "-") for title in titles]
                    self.assertIn(heading, ["", *slugs])
