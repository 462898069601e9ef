"""Breaks the rules that scripts/check-includes and scripts/check-docs keep, each in a tree of its own, and expects that
the line is named. Run by ctest with the directory of the scripts."""
import os
import subprocess
import sys
import tempfile
import unittest

SCRIPTS = sys.argv.pop(1)

# Some floors: (file, what it includes, what is said).
BREACHES = (
    ("platform/base/C.h", "platform/threads/B.h", "not below it in the picture"),
    ("platform/process/E.h", "platform/IPC.h", "not below it in the picture"),
    ("platform/F.h", "platform/process/B.h", "not below it in the picture"),
    ("platform/pulse/A.cpp", "platform/x11/B.h", "names a backend"),
    ("platform/mp4/A.cpp", "support/B.h", "not below it in the picture"),
    ("protocol/H.h", "support/B.h", "not below it in the picture"),
    ("ui/A.cpp", "session/B.h", "not below it in the picture"),
    ("session/A.cpp", "daemon/B.h", "not below it in the picture"),
    ("daemon/A.cpp", "platform/linux/B.h", "names a backend"),
    ("sdk/client/A.cpp", "support/B.h", "not below it in the picture"),
    ("examples/game/A.cpp", "platform/base/B.h", "not below it in the picture"),
)
KEPT = (
    ("daemon/PlatformChoice.cpp", '"platform/linux/B.h"'), ("daemon/A.cpp", '"daemon/QVRecordingManager.h"'),
    ("platform/ffmpeg/A.cpp", '"platform/mp4/B.h"'), ("platform/ffmpeg/A.h", "<libavcodec/avcodec.h>"),
    ("sdk/client/create.cpp", '"platform/sdbus/B.h"'), ("tests/A.cpp", '"platform/linux/B.h"'),
    ("examples/game/A.cpp", "<pulse/simple.h>"), ("build/A.cpp", '"daemon/B.h"'),
)


def run(script, files):
    with tempfile.TemporaryDirectory() as root:
        for path, text in files:
            os.makedirs(os.path.dirname(os.path.join(root, path)), exist_ok=True)
            with open(os.path.join(root, path), "w", encoding="utf-8") as file:
                file.write(text)
        ended = subprocess.run([os.path.join(SCRIPTS, script), root], capture_output=True, text=True, check=False)
        return ended.returncode, sorted(ended.stdout.split("\n")[:-1])


class CheckIncludes(unittest.TestCase):
    def test_every_breach_is_named(self):
        files = [(path, f'#pragma once\n#include "{target}"\n') for path, target, _ in BREACHES]
        files += [("platform/Service.cpp", "\n"), ("ui/Same.h", ""), ("tests/kit/Same.h", ""), ("session/Log.cpp", "#include <systemd/sd-bus.h>\n")]
        said = [f"{path}:2: {target}: {what}" for path, target, what in BREACHES]
        said += ["platform/Service.cpp:1: platform/Service.cpp: contracts are headers",
                 "session/Log.cpp:1: systemd/sd-bus.h: a library's header outside its backend",
                 "Same.h: one name for tests/kit/Same.h and ui/Same.h"]
        self.assertEqual(run("check-includes", files), (1, sorted(said)))

    def test_what_keeps_the_rule_passes(self):
        self.assertEqual(run("check-includes", [(path, f"#include {target}\n") for path, target in KEPT]), (0, []))


class CheckDocs(unittest.TestCase):
    def test_rows_and_sources_agree(self):
        page = ("docs/environment.md", "| `QUORVEL_A` | `a/A.cpp` | | |\n| `QUORVEL_B` | `a/A.cpp` | | |\n")
        code = 'getenv("QUORVEL_A"); getenv("HOME");\n'
        self.assertEqual(run("check-docs", [page, ("a/A.cpp", code), ("tests/B.cpp", code)]), (1, [
            "a/A.cpp: HOME has no row in docs/environment.md",
            "docs/environment.md: QUORVEL_B: a/A.cpp does not know it"]))


unittest.main()
