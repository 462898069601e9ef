"""Makes a bundle for a Python application:

    python3 -m quorvel.bundle MyApp.app --identifier com.example.myapp --name "My App"

The daemon knows an application by the bundle around its executable, and the executable of a Python program is its
interpreter. So the bundle gets an interpreter of its own: a copy, for a link leads the daemon to /usr/bin. Start the
application with that one, `MyApp.app/bin/python3 program.py`. Packages are the system's. Say the same again after an
update of Python: the interpreter is copied anew, and what else is in the bundle, or in its Info.json, stays.
"""
from __future__ import annotations

import argparse
import json
import os
import shutil
import sys
import tempfile


def interpreter() -> str:
    """The executable file of the system's interpreter, also in a virtual environment."""
    return os.path.realpath(getattr(sys, "_base_executable", None) or sys.executable)


def make_bundle(path: str, identifier: str, name: str) -> str:
    """The bundle's interpreter. OSError where it cannot be made. Running processes keep what they run."""
    programs = os.path.join(path, "bin")
    os.makedirs(programs, exist_ok=True)
    own = os.path.join(programs, "python3")
    source = interpreter()
    _replace(own, lambda file: shutil.copy2(source, file))
    _write(os.path.join(path, "pyvenv.cfg"), f"home = {os.path.dirname(source)}\n"
           "include-system-site-packages = true\nversion = {}.{}.{}\n".format(*sys.version_info))
    information = os.path.join(path, "Info.json")
    info = {**_read(information), "CFBundleIdentifier": identifier, "CFBundleDisplayName": name, "CFBundleName": name,
            "CFBundleExecutable": "bin/python3"}
    _write(information, json.dumps(info, indent=2, ensure_ascii=False) + "\n")
    return own


def _read(path: str) -> dict:
    """Nothing where there is no such file."""
    try:
        with open(path, encoding="utf-8") as file:
            return dict(json.load(file))
    except FileNotFoundError:
        return {}
    except (ValueError, TypeError) as error:
        raise OSError(f"{path} cannot be read: {error}") from error


def _write(path: str, content: str) -> None:
    def write(file: str) -> None:
        with open(file, "w", encoding="utf-8") as opened:
            opened.write(content)
    _replace(path, write, 0o644)


def _replace(path: str, make, mode: int = 0o755) -> None:
    """Whole, or not at all."""
    descriptor, beside = tempfile.mkstemp(dir=os.path.dirname(path))
    os.close(descriptor)
    try:
        make(beside)
        os.chmod(beside, mode)
        os.replace(beside, path)
    except BaseException:
        os.unlink(beside)
        raise


def main() -> None:
    parser = argparse.ArgumentParser(prog="python3 -m quorvel.bundle", description=__doc__.split("\n", 1)[0][:-1] + ".")
    parser.add_argument("path", help="the bundle's directory, e.g. MyApp.app")
    parser.add_argument("--identifier", required=True, help="e.g. com.example.myapp")
    parser.add_argument("--name", required=True, help="what the user reads")
    arguments = parser.parse_args()
    try:
        print(make_bundle(os.path.abspath(arguments.path), arguments.identifier, arguments.name))
    except OSError as error:
        sys.exit(f"no bundle: {error}")


if __name__ == "__main__":
    main()
