"""Pages that do not keep their word, each wrong in one place: run.py names the line. Run by ctest with run.py."""
import os
import subprocess
import sys
import tempfile
import unittest

RUN = sys.argv.pop(1)
FENCE = "```"
WRONG = (
    (f"{FENCE}\nls\n{FENCE}", 1, "neither run nor marked"),
    ("text\n\n    ls", 3, "neither run nor marked"),
    (f"<!-- guide: not run: -->\n{FENCE}\nls\n{FENCE}", 2, "neither run nor marked"),
    (f"{FENCE}sh\nfalse\ntrue\n{FENCE}", 1, "ended with 1"),
    (f"{FENCE}sh\nfalse | true\n{FENCE}", 1, "ended with 1"),
    (f"{FENCE}sh\necho one; echo two\n{FENCE}\n<!-- guide: expect -->\n{FENCE}\ntwo\none\n{FENCE}", 5, "expected"),
    (f"{FENCE}json\n{{'a': 1}}\n{FENCE}", 1, "no JSON"),
    (f"<!-- guide: file a.json -->\n{FENCE}\n{{\n{FENCE}", 2, "no JSON"),
    (f"<!-- guide: from README.md -->\n{FENCE}\nno line of that page\n{FENCE}", 2, "does not stand so"),
    (f"<!-- guide: terminal a until test -e there -->\n{FENCE}\nexit 3\n{FENCE}", 2, "has ended"),
    (f"<!-- guide: compile cases -->\n{FENCE}cpp\ncase 1: no_such_name(); break;\n{FENCE}", 2, "ended with 1"),
)
RIGHT = f"""# Page
<!-- guide: file a b.txt -->
{FENCE}
one
{FENCE}
{FENCE}sh
A=two; cd .
cat "a b.txt"
{FENCE}
<!-- guide: terminal a until test -e there -->
{FENCE}
touch there; echo ready for you; sleep 1000
{FENCE}
<!-- guide: expect -->
{FENCE}
ready ... you
{FENCE}
{FENCE}sh
cat "a b.txt"; echo $A
{FENCE}
<!-- guide: expect -->
{FENCE}
one
two
{FENCE}
<!-- guide: not run: it is only shown -->

    false
"""


def follow(text):
    with tempfile.TemporaryDirectory() as folder:
        page = os.path.join(folder, "page.md")
        with open(page, "w", encoding="utf-8") as file:
            file.write(text)
        done = subprocess.run([sys.executable, RUN, page], capture_output=True, text=True, check=False, timeout=100)
        return done.returncode, done.stdout, done.stderr.replace(folder + "/", "")


class Pages(unittest.TestCase):
    def test_what_is_not_so_is_told_with_its_line(self):
        for text, line, what in WRONG:
            code, _, said = follow(text)
            self.assertEqual((code, said.split(": ")[0], what in said), (1, f"page.md:{line}", True), said)

    def test_a_page_that_keeps_its_word(self):
        code, said, wrong = follow(RIGHT)
        self.assertEqual((code, said.split("\n")[-2]), (0, "6 blocks done, 1 marked as not run"), wrong)


unittest.main()
