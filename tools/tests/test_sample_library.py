"""The sample library's program, named by the environment variable KX_MAKE_SAMPLE."""

import os
import subprocess
import tempfile
import unittest


class SampleLibrary(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="kx-sample-")
        self.addCleanup(folder.cleanup)
        self.root = folder.name

    def make(self, name):
        folder = os.path.join(self.root, name)
        subprocess.run([os.environ["KX_MAKE_SAMPLE"], folder], check=True)
        pictures = {}
        for path, _, names in os.walk(folder):
            for file in names:
                with open(os.path.join(path, file), "rb") as stream:
                    pictures[os.path.relpath(os.path.join(path, file), folder)] = stream.read()
        return pictures

    def test_three_folders_of_jpeg_files(self):
        pictures = self.make("a")
        self.assertEqual(len(pictures), 12)
        self.assertEqual({os.path.dirname(path) for path in pictures},
                         {"Mountains", "Seaside", "Birthday"})
        for path, data in pictures.items():
            with self.subTest(path):
                self.assertTrue(data.startswith(b"\xff\xd8") and data.endswith(b"\xff\xd9"))
                self.assertIn(b"Drawn by kxsync", data)
        self.assertEqual(len(set(pictures.values())), 12)

    def test_metadata_of_one_picture(self):
        data = self.make("a")[os.path.join("Mountains", "IMG_0003.jpg")]
        for piece in (b"2023:06:10 13:05:48", b"+02:00", b"Snow in June", b"Ada", b"Grace",
                      b"metadataworkinggroup.com/schemas/regions"):
            with self.subTest(piece):
                self.assertIn(piece, data)

    def test_the_same_bytes_every_time(self):
        self.assertEqual(self.make("a"), self.make("b"))

    def test_wrong_usage(self):
        result = subprocess.run([os.environ["KX_MAKE_SAMPLE"]], capture_output=True, check=False)
        self.assertEqual(result.returncode, 2)


if __name__ == "__main__":
    unittest.main()
