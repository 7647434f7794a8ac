"""docs/drive.md: its session replays line by line, its client works."""

import json
import os
import re
import shutil
import tempfile
import unittest

from console import FERRULE, Console

DOCUMENT = os.path.join(os.path.dirname(__file__), "..", "..", "docs", "drive.md")


def sections():
    with open(DOCUMENT, encoding="utf-8") as stream:
        text = stream.read()
    first, second = text.split("<!-- session -->")[1].split("<!-- restart -->")
    return text, first, second.split("## A client")[0]


def exchanges(section):
    lines = [line[4:] for line in section.splitlines() if re.match("    (->|<-) ", line)]
    return [(lines[i][3:], json.loads(lines[i + 1][3:])) for i in range(0, len(lines), 2)]


class DriveDocument(unittest.TestCase):
    def setUp(self):
        self.root = tempfile.mkdtemp(prefix="drive-document-")
        self.addCleanup(shutil.rmtree, self.root, ignore_errors=True)
        self.device = os.path.join(self.root, "device")

    def test_the_worked_session_replays_line_by_line(self):
        _, *parts = sections()
        for part in parts:
            console = Console(self.device)
            pairs = exchanges(part)
            self.assertGreater(len(pairs), 9)
            for sent, shown in pairs:
                answer = console.line(sent)
                self.assertEqual({key: answer[key] for key in shown}, shown, sent)
            self.assertEqual(console.close(), 0)

    def test_the_client_works(self):
        text, *_ = sections()
        code = text.split("```python\n")[1].split("```")[0]
        self.assertLessEqual(len([line for line in code.splitlines() if line.strip()]), 20)
        names = {}
        exec(code, names)  # pylint: disable=exec-used
        console = names["Console"](self.device, FERRULE)
        self.assertEqual(console("currentSyncAnchor"), "1")
        with self.assertRaises(RuntimeError):
            console("device.moon")
        self.assertEqual(console.close(), 0)
        console.process.stdout.close()


if __name__ == "__main__":
    unittest.main()
