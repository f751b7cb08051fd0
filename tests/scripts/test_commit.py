"""cmake/WriteCommit.cmake: which commit a build names, and that an unchanged one compiles nothing again."""

import os
import re
import subprocess
import tempfile
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
OURSELVES = {"GIT_AUTHOR_NAME": "a", "GIT_AUTHOR_EMAIL": "a@example.org",
             "GIT_COMMITTER_NAME": "a", "GIT_COMMITTER_EMAIL": "a@example.org"}


class WriteCommit(unittest.TestCase):
    def setUp(self):
        directory = tempfile.TemporaryDirectory()
        self.addCleanup(directory.cleanup)
        self.tree = Path(directory.name) / "tree"
        self.tree.mkdir()
        self.output = Path(directory.name) / "made/Commit.cpp"
        # A hook of git sets variables that name its own repository.
        self.environment = {name: value for name, value in os.environ.items() if not name.startswith("GIT_")}

    def git(self, *arguments):
        return subprocess.run(["git", "-C", self.tree, *arguments], env={**self.environment, **OURSELVES},
                              stdout=subprocess.PIPE, text=True, check=True).stdout.strip()

    def commit(self, message):
        self.git("commit", "--quiet", "--allow-empty", "--message", message)
        return self.git("rev-parse", "HEAD")[:12]

    def written(self, tree=None):
        subprocess.run(["cmake", f"-DSOURCE={tree or self.tree}", f"-DOUTPUT={self.output}",
                        "-P", ROOT / "cmake/WriteCommit.cmake"], env=self.environment, check=True)
        found, = re.findall(r'return "(.*)";', self.output.read_text())
        return found

    def test_a_repository_gives_its_commit(self):
        self.git("init", "--quiet")

        for message in "one", "two":
            commit = self.commit(message)
            self.assertEqual(self.written(), commit)

    def test_an_unchanged_commit_leaves_the_file_alone(self):
        self.git("init", "--quiet")
        self.commit("one")
        self.written()
        os.utime(self.output, (1, 1))

        self.written()
        self.assertEqual(self.output.stat().st_mtime, 1)

        self.commit("two")
        self.written()
        self.assertNotEqual(self.output.stat().st_mtime, 1)

    def test_an_archive_has_no_commit_even_inside_the_repository_of_another(self):
        self.git("init", "--quiet")
        self.commit("one")
        archive = self.tree / "build/archive"
        archive.mkdir(parents=True)

        self.assertEqual(self.written(archive), "")

    def test_a_repository_without_a_commit_has_none(self):
        self.git("init", "--quiet")

        self.assertEqual(self.written(), "")

    def test_the_file_of_a_package_build_names_the_commit(self):
        (self.tree / "COMMIT").write_text("0123456789ab\n")

        self.assertEqual(self.written(), "0123456789ab")

    def test_other_text_is_not_a_commit(self):
        (self.tree / "COMMIT").write_text('"; system("x\n')

        self.assertEqual(self.written(), "")


if __name__ == "__main__":
    unittest.main()
