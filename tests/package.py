#!/usr/bin/env python3
"""Makes the Debian package, installs it below an empty directory, shows everything from there, and removes it."""
import os
import pathlib
import re
import subprocess
import tempfile

from runs import build, top

expected = """bin/tarvelctl bin/tarvelexport bin/tarvellab share/bash-completion/completions/tarvelctl
    share/bash-completion/completions/tarvelexport share/bash-completion/completions/tarvellab
    share/doc/tarvelctl/changelog.Debian.gz share/doc/tarvelctl/copyright
    share/doc/tarvelctl/from-symptom-to-command.md share/fish/vendor_completions.d/tarvelctl.fish
    share/fish/vendor_completions.d/tarvelexport.fish share/fish/vendor_completions.d/tarvellab.fish
    share/man/man1/tarvelctl.1.gz share/man/man1/tarvelexport.1.gz share/man/man1/tarvellab.1.gz
    share/man/man5/tarvel-tables.5.gz share/zsh/vendor-completions/_tarvelctl
    share/zsh/vendor-completions/_tarvelexport share/zsh/vendor-completions/_tarvellab""".split()


def run(*words):
    return subprocess.run(words, check=True, stdout=subprocess.PIPE, text=True).stdout


def check_has(text, *signs):
    assert all(sign in text for sign in signs), f"not all of {signs} in\n{text}"


with tempfile.TemporaryDirectory(prefix="package_test") as scratch:
    scratch, root = pathlib.Path(scratch), pathlib.Path(scratch, "root")
    run("cpack", "--config", build / "CPackConfig.cmake", "-G", "DEB", "-B", scratch / "made")
    package, = scratch.glob("made/*.deb")
    check_has(run("dpkg-deb", "--field", package, "Depends"), "libc6", "libuuid1", "libstdc++6")

    # What it depends on is installed elsewhere.
    for name in "info", "updates":
        (root / "var/lib/dpkg" / name).mkdir(parents=True)
    (root / "var/lib/dpkg/status").touch()
    dpkg = ("dpkg", f"--root={root}", f"--log={scratch}/log", "--force-depends", "--force-not-root")
    run(*dpkg, "--install", package)
    installed = sorted(str(path.relative_to(root / "usr")) for path in root.glob("usr/**/*") if not path.is_dir())
    assert installed == expected, installed
    for program in "tarvelctl", "tarvelexport", "tarvellab":
        check_has(run("readelf", "--wide", "--segments", "--dynamic", "--dyn-syms", root / "usr/bin" / program),
                  "GNU_RELRO", "BIND_NOW", "__stack_chk_fail", "__snprintf_chk")

    os.environ.pop("TARVEL_ROOT", None)
    os.environ["CDPATH"] = str(scratch)  # has such a folder too
    (scratch / "scripts").mkdir()
    os.chdir(top)
    shown = run("scripts/demo", root / "usr/bin")
    check_has(shown, f"PATH={root}/usr/bin:", "tarvelctl provider -D", "Instances: 14", "Proto Local Address",
              "LISTENER")
    three_screens, lines = 3 * 24, shown.splitlines()
    assert len(lines) <= three_screens and max(map(len, lines[1:])) <= 120, shown
    check_has((top / "build/demo/netstat_-a_-n.txt").read_text(), "MULTIPLE")
    assert not (scratch / "build").exists()
    guide = (root / "usr/share/doc/tarvelctl/from-symptom-to-command.md").read_text()
    assert not re.search(r"\]\((?!#)", guide), "a link to a page that is not installed"

    run(*dpkg, "--purge", "tarvelctl")
    assert [path.name for path in root.iterdir()] == ["var"]
