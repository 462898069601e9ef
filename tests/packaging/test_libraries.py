"""What the built programs are linked with, and what leaves the two libraries that others link. Run by ctest with the
build directory and the sources."""
import glob
import os
import re
import subprocess
import sys
import unittest

BUILD, SOURCE = (os.path.abspath(path) for path in (sys.argv.pop(1), sys.argv.pop(1)))
# Needed by every program; THIRD-PARTY.md has them in a sentence.
RUNTIME = {"libc.so.6", "libm.so.6", "libgcc_s.so.1", "libstdc++.so.6", "ld-linux-x86-64.so.2", "ld-linux-aarch64.so.1"}
# Permissive or LGPL, or with an exception for whoever links it: libsystemd, and what that needs.
FREE = RUNTIME | {"linux-vdso.so.1", "libsystemd.so.0", "libcap.so.2", "libgcrypt.so.20", "libgpg-error.so.0", "liblzma.so.5",
                  "libzstd.so.1", "liblz4.so.1"}
# Each library, and the folders of its public headers.
SDK = {"sdk/client/libquorvel.so.0": ("sdk/client", "sdk/c", "sdk/common"),
       "sdk/extension/libquorvel-extension.so.0": ("sdk/extension", "sdk/common")}
PROGRAMS = ("bin/quorveld", "bin/quorveld-extensions", "bin/quorvel-extension-launcher", "bin/quorvelctl",
            "lib/quorveld/*", "tools/quorvelctl/*.app/bin/*", "examples/*/*.app/bin/*", "examples/*/*.app/PlugIns/*/bin/*",
            "sdk/played-host/played-host", *SDK)


def output(*command):
    return subprocess.run(command, capture_output=True, text=True, check=True).stdout


def needed(path):
    return {os.path.basename(name) for name in re.findall(r"\(NEEDED\).*\[(.*)\]", output("readelf", "-dW", path))}


def read(path):
    with open(path, encoding="utf-8") as file:
        return file.read()


class Libraries(unittest.TestCase):
    maxDiff = None

    def test_what_applications_link_drags_nothing_under_the_gpl_in(self):
        for library in SDK:
            loaded = {os.path.basename(line.split()[0]) for line in output("ldd", os.path.join(BUILD, library)).splitlines()}
            self.assertIn("libsystemd.so.0", loaded)
            self.assertEqual(loaded - FREE, set(), library)

    def test_only_what_the_public_headers_declare_leaves_them(self):
        for library, folders in SDK.items():
            declared = "".join(read(header) for folder in folders
                               for header in glob.glob(os.path.join(SOURCE, folder, "quorvel/*.h")))
            names = output("nm", "-DC", "--defined-only", "--format=posix", os.path.join(BUILD, library)).splitlines()
            self.assertTrue(any("::create(" in name for name in names), names)
            for name in names:
                known = re.match(r"(?:typeinfo for |typeinfo name for |vtable for )?quorvel::(\w+)|(quorvel_\w+)", name)
                self.assertIsNotNone(known, f"{library} shows {name}")
                self.assertRegex(declared, rf"\b{known[1] or known[2]}\b", f"{library} shows {name}")

    def test_the_page_of_licences_has_what_each_program_needs(self):
        told = {}
        for libraries, users in re.findall(r"^\| (`lib.*?) \|.*\| (.*?) \|$", read(os.path.join(SOURCE, "THIRD-PARTY.md")),
                                           re.MULTILINE):
            for user in re.findall(r"`(.*?)`", users):
                told.setdefault(user, set()).update(re.findall(r"`(.*?)`", libraries))
        programs = [path for pattern in PROGRAMS for path in glob.glob(os.path.join(BUILD, pattern))]
        found = {os.path.basename(path): {name for name in needed(path) - RUNTIME if "quorvel" not in name}
                 for path in programs}
        self.assertEqual({name: sorted(libraries) for name, libraries in found.items() if libraries},
                         {name: sorted(libraries) for name, libraries in told.items()})


if __name__ == "__main__":
    unittest.main()
