#!/usr/bin/env python3
"""Does what a page of the documentation tells its reader to do: from the page's own text, in a fresh folder.

    run.py PAGE [--prefix DIR]     DIR: where everything is installed (DESTDIR of an installation into /usr); / without

What becomes of a block of the page stands in a comment before it, "<!-- guide: ... -->":

    after PAGE#SECTION       (no block) the blocks of another page's section come first
    run              typed into a terminal; so are blocks of sh without a comment. It must end with 0
    demo             the same in the sources, and it may end otherwise: demos judge how fast the machine is. What it must
                     have said stands in an "expect" below
    terminal NAME [until COMMAND]    typed into a terminal of that name, where it goes on; what went on there before ends
    expect                   lines, in this order, among what the last commands say; "..." in them is anything
    file NAME                written there
    json                     must be JSON; so must blocks of json without a comment
    compile NAME             a part of a program, for the place that NAME.cpp beside this file keeps for it
    from FILE                stands so in that file of the sources
    not run: WHY             for what cannot be run; the page tells its readers too, where they would try

Any other block is a failure. The last line is "N blocks done, M marked as not run".
"""
import argparse
import json
import os
import re
import shutil
import signal
import subprocess
import sys
import tempfile
import time

HERE = os.path.dirname(os.path.abspath(__file__))
SOURCES = os.path.dirname(os.path.dirname(HERE))
sys.path.insert(0, os.path.join(SOURCES, "scripts"))
from stage.processes import wait_until  # noqa: E402

COMMENT = re.compile(r" *<!-- guide: (.+) -->$")
BY_LANGUAGE = {"sh": "run", "json": "json"}
PATIENCE = 240  # seconds, for what never ends


class Failure(Exception):
    """What the page promises is not so."""


class Block:
    def __init__(self, line, section, order, language=""):
        self.line, self.section, self.lines = line, section, []
        self.order = order or BY_LANGUAGE.get(language, "")

    @property
    def text(self):
        return "".join(line + "\n" for line in self.lines)


def blocks_of(page):
    """What stands between fences, or four columns in after an empty line."""
    found, order, section, former = [], "", "", ""
    fenced = indented = False
    with open(page, encoding="utf-8") as file:
        lines = file.read().split("\n")
    for number, line in enumerate(lines, 1):
        if fenced:
            fenced = line.rstrip() != "```"
            if fenced:
                found[-1].lines.append(line)
        elif line.startswith("    ") and (indented or not former):
            if not indented:
                found.append(Block(number, section, order))
            found[-1].lines.append(line[4:])
            indented, order = True, ""
        elif line:
            indented, comment = False, COMMENT.match(line)
            if line.startswith("```"):
                found.append(Block(number, section, order, line[3:]))
                fenced, order = True, ""
            elif comment and comment[1].startswith("after "):
                found.append(Block(number, section, comment[1]))
            elif comment:
                order = comment[1]
            elif line.startswith("#"):
                section = re.sub(r"[^\w -]", "", line.lower()).strip().replace(" ", "-")
        elif indented:
            found[-1].lines.append("")
        former = line
    return found


class Terminal:
    """A bash, as readers have one. What was started in it ends with it."""

    def __init__(self, folder, environment):
        self.log = tempfile.TemporaryFile("a+", errors="replace")  # "a": reading must not move where it writes
        self.shell = subprocess.Popen(["bash", "--noprofile", "--norc", "-eo", "pipefail"], cwd=folder, env=environment,
                                      stdin=subprocess.PIPE, stdout=self.log, stderr=subprocess.STDOUT, text=True,
                                      start_new_session=True)
        self.mark = 0

    def type(self, text):
        """The name of a file that goes when the commands have ended."""
        self.mark = os.fstat(self.log.fileno()).st_size
        with tempfile.NamedTemporaryFile("w", suffix=".sh", delete=False) as script:
            script.write(text)
        self.shell.stdin.write(f". {script.name} </dev/null\nrm {script.name}\n")
        self.shell.stdin.flush()
        return script.name

    def run(self, text):
        script, limit = self.type(text), time.monotonic() + PATIENCE
        while os.path.exists(script):
            try:
                code = self.shell.wait(0.02)
                os.remove(script)
                raise Failure(f"ended with {code}:\n{self.said()}")
            except subprocess.TimeoutExpired:
                if time.monotonic() > limit:
                    raise Failure(f"goes on after {PATIENCE} s:\n{self.said()}") from None

    def said(self):
        """By what was typed last."""
        self.log.seek(self.mark)
        return self.log.read()

    def has_gone(self):
        """With all that was started in it: a daemon that is still ending would answer in the place of the next."""
        self.shell.poll()
        try:
            os.killpg(self.shell.pid, 0)
        except ProcessLookupError:
            return True
        return False

    def close(self):
        for number in (signal.SIGTERM, signal.SIGKILL):
            try:
                os.killpg(self.shell.pid, number)
                return wait_until("the end of a terminal", self.has_gone, seconds=15, step=0.02)
            except ProcessLookupError:
                return None
            except AssertionError:
                continue
        return None


class Reader:
    """Somebody who has the page, a folder and terminals."""

    def __init__(self, folder, prefix):
        self.folder, self.done, self.left_out = folder, 0, 0
        self.environment = {"PATH": os.environ["PATH"], "HOME": folder, "TMPDIR": folder, "SDK": prefix.rstrip("/"),
                            "LC_ALL": "C.UTF-8", "NO_AT_BRIDGE": "1"}
        self.terminals = {}
        self.last = self.own = self.open_terminal("")

    def open_terminal(self, name):
        if name in self.terminals:
            self.terminals.pop(name).close()
        self.terminals[name] = Terminal(self.folder, self.environment)
        return self.terminals[name]

    def close(self):
        for terminal in reversed(self.terminals.values()):
            terminal.close()

    def read(self, page, section=None):
        for block in blocks_of(page):
            if section is not None and block.section != section:
                continue
            print(f"{os.path.basename(page)}:{block.line}: {block.order}", flush=True)
            try:
                self.follow(block, page)
            except Failure as failure:
                raise Failure(f"{page}:{block.line}: {failure}") from None

    def follow(self, block, page):
        word, _, rest = block.order.partition(" ")
        if word == "after":
            name, _, section = rest.partition("#")
            return self.read(os.path.join(os.path.dirname(page), name), section)
        if block.order.startswith("not run: "):
            self.left_out += 1
            return None
        orders = {"run": self.run, "demo": self.show, "terminal": self.use_terminal, "expect": self.expect, "file": self.write,
                  "json": self.parse, "compile": self.compile, "from": self.compare}
        if word not in orders:
            raise Failure(f"is neither run nor marked as not run:\n{block.text}")
        self.done += 1
        return orders[word](rest, block.text)

    def run(self, _, text):
        self.last = self.own
        self.last.run(text)

    def show(self, _, text):
        self.run(_, f"(cd {SOURCES}\n{text}) || true\n")

    def use_terminal(self, words, text):
        name, _, until = words.partition(" until ")
        self.last = self.open_terminal(name)
        self.last.type(text)

        def is_so():
            if self.last.shell.poll() is not None:
                raise Failure(f"has ended:\n{self.last.said()}")
            return subprocess.run(["bash", "-c", until], cwd=self.folder, env=self.environment, stdin=subprocess.DEVNULL,
                                  capture_output=True).returncode == 0
        wait_until(until, is_so, step=0.05)

    def expect(self, _, text):
        wanted = [".*".join(map(re.escape, line.strip().split("..."))) for line in text.split("\n") if line.strip()]

        def is_said():
            lines = iter(self.last.said().split("\n"))
            return all(any(re.fullmatch(line, said.strip()) for said in lines) for line in wanted)
        try:
            # Where something goes on it may come yet.
            wait_until("", is_said, seconds=0 if self.last is self.own else 20, step=0.05)
        except AssertionError:
            raise Failure(f"expected\n{text}but was said\n{self.last.said()}") from None

    def write(self, name, text):
        if name.endswith(".json"):
            self.parse("", text)
        path = os.path.join(self.folder, name)
        os.makedirs(os.path.dirname(path), exist_ok=True)
        with open(path, "w", encoding="utf-8") as file:
            file.write(text)

    def parse(self, _, text):
        try:
            json.loads(text)
        except ValueError as error:
            raise Failure(f"no JSON: {error}\n{text}") from None

    def compile(self, name, text):
        with open(os.path.join(HERE, name + ".cpp"), encoding="utf-8") as file:
            self.write("listing.cpp", file.read().replace("// LISTING", f'#line 1 "the listing"\n{text}'))
        self.own.run("g++ -std=c++20 -fsyntax-only -Wall listing.cpp $(pkg-config --cflags quorvel quorvel-extension)\n")

    def compare(self, name, text):
        with open(os.path.join(SOURCES, name), encoding="utf-8") as file:
            if text.strip() not in file.read():
                raise Failure(f"does not stand so in {name}:\n{text}")


def main():
    arguments = argparse.ArgumentParser()
    arguments.add_argument("page")
    arguments.add_argument("--prefix", default="/")
    chosen = arguments.parse_args()
    os.umask(0o022)
    folder = tempfile.mkdtemp(prefix="quorveld-guide-")
    os.chmod(folder, 0o755)  # extensions of a root daemon are users of their own
    reader = Reader(folder, os.path.abspath(chosen.prefix))
    try:
        reader.read(chosen.page)
    except Failure as failure:
        sys.exit(str(failure))
    finally:
        reader.close()
        shutil.rmtree(folder, ignore_errors=True)
    print(f"{reader.done} blocks done, {reader.left_out} marked as not run")


main()
