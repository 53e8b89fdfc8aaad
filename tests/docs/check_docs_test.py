#!/usr/bin/env python3
"""tools/check-docs finds what is wrong with a document, and nothing else.

usage: check_docs_test.py CHECK_DOCS
"""
import pathlib
import subprocess
import sys
import tempfile
import unittest

CHECK_DOCS = sys.argv.pop()

APPLICATION = 'constexpr std::array command_rows = {\n    {"sign", "Sign a file", define_sign},\n};\n'


class CheckDocsTest(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.root = pathlib.Path(folder.name)
        self.write("src/ta/begin.cpp", "TEE_Result open_and_authorize();\n")
        self.write("client/kmctl/application.cpp", APPLICATION)
        self.write("docs/other.md", "# Other page\n\n## Buffer sizes: `b` and more\n")

    def write(self, name, text):
        path = self.root / name
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text(text, encoding="utf-8")

    def check(self, text):
        self.write("README.md", text)
        run = subprocess.run([sys.executable, CHECK_DOCS, str(self.root)], capture_output=True, text=True, check=False)
        return run.returncode, run.stdout.strip()

    def expect_fault(self, text, fault):
        self.assertEqual(self.check(text), (1, f"README.md:{fault}"))

    def test_accepts_a_document_that_speaks_of_what_exists(self):
        text = ("# Top\n\n[other](docs/other.md) [sizes](docs/other.md#buffer-sizes-b-and-more) [top](#top) [web](https://x.y/z)\n"
                "`src/ta/begin.cpp` `src/ta/*.cpp` `begin.cpp` `open_and_authorize` `kmctl sign` `a/b` `any text_like this`\n"
                "```\n[not a link](nowhere) kmctl sign\n```\n")
        self.assertEqual(self.check(text), (0, "2 documents speak of what exists"))

    def test_finds_a_link_to_a_missing_file(self):
        self.expect_fault("\n[x](docs/gone.md)\n", "2: the link docs/gone.md leads nowhere")

    def test_finds_a_picture_that_is_missing(self):
        self.expect_fault("![x](docs/gone.svg)\n", "1: the link docs/gone.svg leads nowhere")

    def test_finds_a_link_to_a_missing_heading(self):
        self.expect_fault("[x](docs/other.md#gone)\n", "1: the link docs/other.md#gone names a heading that is not there")

    def test_finds_a_missing_path_in_code(self):
        self.expect_fault("`src/ta/gone.cpp`\n", "1: `src/ta/gone.cpp` does not exist")

    def test_finds_a_missing_command_in_code(self):
        self.expect_fault("`./gone --fast`\n", "1: `./gone` does not exist")

    def test_finds_a_missing_file_name_in_code(self):
        self.expect_fault("`gone.cpp`\n", "1: there is no file `gone.cpp`")

    def test_finds_an_identifier_that_is_not_in_the_code(self):
        self.expect_fault("`open_and_gone`\n", "1: `open_and_gone` is not in the code")

    def test_finds_a_missing_command_in_a_block(self):
        self.expect_fault("```\n./gone --fast\n```\n", "2: `./gone` does not exist")

    def test_finds_a_test_that_is_not_there(self):
        self.write("tests/seal_test.cpp", "TEST(SealTest, Opens) {}\n")
        self.assertEqual(self.check("`SealTest.Opens`\n")[0], 0)
        self.expect_fault("`SealTest.Closes`\n", "1: there is no test `SealTest.Closes`")

    def test_finds_an_unknown_sub_command_in_a_block(self):
        self.expect_fault("text\n```\nkmctl fly\n```\n", "3: kmctl has no sub-command fly")


if __name__ == "__main__":
    unittest.main()
