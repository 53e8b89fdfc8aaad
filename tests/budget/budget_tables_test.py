"""Holds budget_tables.py to what it promises, on documents and figures that this test makes up."""
import contextlib
import io
import json
import pathlib
import sys
import tempfile
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent))
import budget_tables

UUID = "fbacea43-f475-4df3-866f-76256aba994f"
STACK = """| entry point, command | stack | innermost function |
|---|---:|---|
| `TA_InvokeCommandEntryPoint` | 1872 | `write` |
| `18 finish` | 1872 | `write` |
| `0xFF04 set_fid` | 40 | `set` |
the rest is no table
"""
HEAP = """| what | heap bytes |
|---|---:|
| a fresh instance | 17728 |

| operation | begin | held by 16 |
|---|---:|---:|
| RSA-4096 sign | 9000 | 16384 |
| RSA-2048 soter sign | 9000 | 79360 |
| EC-256 sign | 900 | 6528 |
"""
NAMES = ["summary", "part of the image", "entry point, command", "what", "operation", budget_tables.SUITE]


class BudgetTables(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name)
        self.image = self.folder / f"{UUID}.ta"
        self.image.touch()
        self.document = self.folder / "page.md"
        self.document.write_text(
            "".join(f"Before.\n<!-- measured: {name} -->\n<!-- end -->\nAfter.\n" for name in NAMES))
        self.reports = self.folder / "reports"
        self.reports.mkdir()
        self.sizes = {"code": 49316, "read-only data": 16000, "data": 0, "bss": 368}
        self.addCleanup(setattr, budget_tables, "parts", budget_tables.parts)
        self.addCleanup(setattr, budget_tables, "Elf", budget_tables.Elf)
        budget_tables.parts, budget_tables.Elf = lambda _: self.sizes, lambda path: path
        self.stack, self.heap = STACK, HEAP
        self.report("one", f"{UUID} 18 30000\n{UUID} 65284 2048\n")

    def report(self, name, lines):
        (self.reports / f"{name}.txt").write_text(lines)

    def run_tool(self, *options):
        sources = self.folder / "sources.json"
        sources.write_text(json.dumps({
            "documents": [str(self.document)], "image": str(self.image), "reports": str(self.reports),
            "stack": [sys.executable, "-c", f"print({self.stack!r})"],
            "heap": [sys.executable, "-c", f"print({self.heap!r})"]}))
        shown = io.StringIO()
        with contextlib.redirect_stdout(shown):
            status = budget_tables.main([str(sources), *options])
        return status, shown.getvalue()

    def must_write(self):
        self.assertEqual(self.run_tool("--write"), (0, "6 tables are as measured\n"))

    def expect_fault(self, *words):
        status, shown = self.run_tool()
        self.assertEqual(status, 1)
        for word in words:
            self.assertIn(word, shown)

    def test_what_was_written_is_as_measured_and_the_text_around_it_stays(self):
        self.must_write()
        text = self.document.read_text()
        self.assertEqual((text.count("Before.\n<!--"), text.count("-->\nAfter.\n")), (6, 6))
        self.assertEqual(self.run_tool(), (0, "6 tables are as measured\n"))
        for line in ("| code and read-only data, of 65,536 | 65,316 |", "| `18 finish` | 1,872 | `write` |",
                     "| RSA-4096 sign | 9,000 | 16,384 |", "| `18 finish` | 30,720 |", "| `0xFF04 set_fid` | 3,072 |",
                     "| code and read-only data | 65,316 | 65,536 |",
                     "| stack of its own functions, at most (`18 finish`) | 1,872 | 4,096 |",
                     "| heap of 16 live operations, at most (RSA-2048 soter sign) | 79,360 | 524,288 |"):
            self.assertIn(line + "\n", text)

    def test_an_empty_document_is_not_as_measured(self):
        self.expect_fault("page.md: the table summary should read", "page.md: no row for 18 finish")

    def test_a_figure_that_moved_is_found(self):
        self.must_write()
        self.sizes["code"] += 1
        self.expect_fault("the table part of the image should read", "49,317")
        self.sizes["code"] -= 1
        self.stack = STACK.replace("| 40 |", "| 48 |")
        self.expect_fault("the table entry point, command should read", "| `0xFF04 set_fid` | 48 | `set` |")
        self.stack, self.heap = STACK, HEAP.replace("17728", "17736")
        self.expect_fault("the table what should read", "| a fresh instance | 17,736 |")

    def test_the_heap_of_a_command_is_a_ceiling(self):
        self.must_write()
        self.report("two", f"{UUID} 18 30720\n")
        self.assertEqual(self.run_tool()[0], 0)
        self.report("two", f"{UUID} 18 30721\n")
        self.expect_fault("18 finish took 30721 bytes, the document says 30,720")

    def test_a_ceiling_far_above_what_was_seen_is_stale(self):
        self.must_write()
        self.report("one", f"{UUID} 18 14000\n{UUID} 65284 2048\n")
        self.expect_fault("18 finish took 14000 bytes, the document says 30,720")

    def test_reports_of_other_tas_do_not_count(self):
        self.must_write()
        self.report("other", "11d0a5d2-6f0c-4f3e-9d0e-0d6a5b1c2e01 18 500000\n")
        self.assertEqual(self.run_tool()[0], 0)

    def test_a_command_that_no_test_reported_is_a_fault(self):
        self.must_write()
        self.report("one", f"{UUID} 18 30000\n")
        self.expect_fault("no test reported the heap of 0xFF04 set_fid: run all tests first")

    def test_a_table_that_nobody_shows_and_one_that_nobody_measures_are_faults(self):
        self.must_write()
        self.document.write_text(self.document.read_text().replace("measured: what", "measured: wat"))
        self.expect_fault("page.md: nothing measures wat", "no document shows the table what")


if __name__ == "__main__":
    unittest.main(verbosity=2)
