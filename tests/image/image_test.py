"""What a linked TA image asks of its loader and offers to it.

usage: image_test.py IMAGE HEADER_FOLDER [companion]

IMAGE is `<uuid>.ta`; HEADER_FOLDER holds the headers of the TEE, so that the lists here cannot drift away from them. A
companion may use whatever those headers declare.
"""
import pathlib
import re
import sys
import unittest
import uuid

import names
from elf import Elf

EXPORTED = {
    "ta_head", "ta_properties", "tee_trace_prefix", "TA_CreateEntryPoint", "TA_DestroyEntryPoint",
    "TA_OpenSessionEntryPoint", "TA_CloseSessionEntryPoint", "TA_InvokeCommandEntryPoint",
}


class Image(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.image = Elf(IMAGE)
        cls.undefined, cls.defined = cls.image.dynamic_symbols()

    def test_it_imports_nothing_but_the_platforms_calls_and_the_compilers_helpers(self):
        self.assertEqual(names.stray(self.undefined, DECLARED if IS_COMPANION else set()), set())

    def test_no_forbidden_name_is_imported_or_linked_in(self):
        self.assertEqual(names.forbidden(self.undefined, self.image.defined), set())

    def test_it_refers_to_every_call_that_its_commands_need(self):
        if IS_COMPANION:
            self.assertEqual(set(names.ENTRY_LAYER) - self.undefined, set())
            return
        self.assertEqual(names.missing(self.undefined), set())

    def test_the_calls_listed_are_declared_by_the_tees_headers(self):
        self.assertEqual((names.USED | names.PERMITTED | set(names.ENTRY_LAYER)) - DECLARED, set())

    def test_it_exports_its_records_and_entry_points_and_nothing_else(self):
        self.assertEqual(self.defined, EXPORTED)

    def test_it_needs_no_other_library(self):
        self.assertNotIn("(NEEDED)", self.image.readelf("--dynamic"))

    def test_nothing_in_it_runs_before_the_entry_points(self):
        self.assertEqual([name for name in self.image.sections
                          if name.startswith((".init", ".fini", ".ctors", ".dtors", ".preinit_array"))], [])

    def test_it_has_no_thread_local_storage_and_no_exception_tables(self):
        self.assertEqual([name for name in self.image.sections
                          if name.startswith((".tdata", ".tbss", ".gcc_except_table", ".ARM.ex"))], [])

    def test_no_part_of_it_is_both_writable_and_executable(self):
        segments = [segment for segment in self.image.segments if segment.kind in ("LOAD", "GNU_STACK")]
        self.assertEqual({segment.kind for segment in segments}, {"LOAD", "GNU_STACK"})
        self.assertEqual([segment for segment in segments if "W" in segment.flags and "E" in segment.flags], [])
        self.assertNotIn("TEXTREL", self.image.readelf("--dynamic"))

    def test_the_header_record_stands_in_its_section_with_the_uuid_of_the_file(self):
        self.assertIn(".ta_head", self.image.sections)
        section = self.image.sections[".ta_head"]
        self.assertEqual(section.kind, "PROGBITS")
        self.assertIn("A", section.flags)
        # UUID, stack size, flags, three entry pointers
        self.assertEqual(section.size, 16 + 4 + 4 + 3 * self.image.word)
        record = self.image.bytes_of(".ta_head")
        # Field by field in the processor's order, as the standard's structure has it.
        self.assertEqual(uuid.UUID(bytes_le=record[:16]), uuid.UUID(IMAGE.stem))
        self.assertEqual(uuid.UUID(IMAGE.stem).version, 4)
        self.assertEqual(int.from_bytes(record[16:20], "little"), 8 * 1024)
        # user mode, executed from DDR, single instance, many sessions
        self.assertEqual(int.from_bytes(record[20:24], "little"), 0xF)

    def test_the_header_record_points_at_the_platforms_entry_layer(self):
        self.assertEqual(self.image.relocations(".ta_head"),
                         {24 + i * self.image.word: name for i, name in enumerate(names.ENTRY_LAYER)})


if __name__ == "__main__":
    IMAGE, HEADERS = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
    IS_COMPANION = sys.argv[3:] == ["companion"]
    DECLARED = {name for path in HEADERS.glob("*.h")
                for name in re.findall(r"\b(\w+)\(", path.read_text(encoding="utf-8"))}
    unittest.main(argv=sys.argv[:1], verbosity=2)
