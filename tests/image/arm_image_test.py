"""The files that a device with an ARMv7-A processor takes: the linked image, and the object that its own SDK links.

usage: arm_image_test.py IMAGE OBJECT LINKER LINKER_SCRIPT

IMAGE is `<uuid>.ta` and OBJECT `<uuid>.o`; LINKER and LINKER_SCRIPT link the object as a device's SDK would.
"""
import pathlib
import struct
import subprocess
import sys
import tempfile
import unittest
import uuid

import names
from elf import PARTS, Elf, parts

STACK_SIZE = 0x2000
FLAGS = 0xF  # user mode, executed from DDR, single instance, many sessions
CODE_AND_CONSTANTS = 64 * 1024
OFFERED = ["TA_CreateEntryPoint", "TA_DestroyEntryPoint", "TA_OpenSessionEntryPoint", "TA_CloseSessionEntryPoint",
           "TA_InvokeCommandEntryPoint", "ta_properties", "tee_trace_prefix"]


def first_bytes_loaded(elf, count):
    first = min((segment for segment in elf.segments if segment.kind == "LOAD" and segment.memory_size),
                key=lambda segment: segment.address)
    return elf.content[first.offset:first.offset + min(count, first.file_size)]


def header_record(*entries):
    return struct.pack("<16sII3I", uuid.UUID(IMAGE.stem).bytes_le, STACK_SIZE, FLAGS, *entries)


class ForTheProcessor:
    """What holds for both files."""

    def attributes(self):
        return dict(line.strip().split(": ", 1) for line in self.elf.readelf("--arch-specific").splitlines()
                    if ": " in line)

    def test_it_is_thumb_code_for_armv7_a_with_hard_floating_point(self):
        attributes = self.attributes()
        self.assertEqual(attributes["Tag_CPU_arch"], "v7")
        self.assertEqual(attributes["Tag_CPU_arch_profile"], "Application")
        self.assertEqual(attributes["Tag_THUMB_ISA_use"], "Thumb-2")
        self.assertEqual(attributes["Tag_ABI_VFP_args"], "VFP registers")

    def test_it_makes_no_access_that_is_not_aligned_and_needs_no_instruction_to_divide(self):
        self.assertNotIn("Tag_CPU_unaligned_access", self.attributes())
        self.assertNotIn("Tag_DIV_use", self.attributes())

    def test_no_forbidden_name_is_in_it(self):
        self.assertEqual(names.forbidden(self.elf.undefined, self.elf.defined), set())

    def test_it_lacks_the_platforms_calls_and_nothing_else(self):
        self.assertEqual(names.stray(self.elf.undefined), set())
        self.assertEqual(names.missing(self.elf.undefined), set())

    def test_it_defines_the_two_functions_that_are_named_like_calls_of_a_platform(self):
        for name in ("TEE_DeriveKK", "ComputeSignature"):
            self.assertTrue([symbol for symbol in self.elf.defined if name in symbol], name)

    def test_nothing_in_it_runs_before_the_entry_points(self):
        self.assertEqual([name for name in self.elf.sections
                          if name.startswith((".init", ".fini", ".ctors", ".dtors", ".preinit_array"))], [])

    def test_the_header_record_is_36_bytes_with_the_entry_layers_addresses_left_open(self):
        self.assertEqual(self.elf.sections[".ta_head"].size, 36)
        self.assertEqual(self.elf.bytes_of(".ta_head"), header_record(0, 0, 0))
        self.assertEqual(self.elf.relocations(".ta_head"),
                         {24 + 4 * i: name for i, name in enumerate(names.ENTRY_LAYER)})


class Image(ForTheProcessor, unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.elf = Elf(IMAGE)

    def test_the_header_record_is_the_first_that_is_loaded(self):
        self.assertEqual(first_bytes_loaded(self.elf, 36), header_record(0, 0, 0))

    def test_the_header_record_cannot_be_written_once_the_addresses_are_in_it(self):
        relro = [segment for segment in self.elf.segments if segment.kind == "GNU_RELRO"]
        self.assertEqual([segment.address for segment in relro], [self.elf.sections[".ta_head"].address])
        # The loader protects whole pages.
        self.assertGreater(relro[0].memory_size, 0)
        self.assertEqual(relro[0].memory_size % 4096, 0)

    def test_every_section_that_is_loaded_is_counted_or_is_the_loaders(self):
        known = {name for names_of_part in PARTS.values() for name in names_of_part}
        self.assertEqual({name for name, section in self.elf.sections.items() if "A" in section.flags} - known, set())

    def test_code_and_read_only_data_stay_within_64_kib(self):
        sizes = parts(self.elf)
        for name, size in sizes.items():
            print(f"{name:<15}{size:>7}")
        print(f"{'code + read-only data':<15} {sizes['code'] + sizes['read-only data']} of {CODE_AND_CONSTANTS}")
        self.assertLessEqual(sizes["code"] + sizes["read-only data"], CODE_AND_CONSTANTS)


class Object(ForTheProcessor, unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.elf = Elf(OBJECT)
        cls.elf.undefined.discard("_GLOBAL_OFFSET_TABLE_")  # every linker makes it

    def test_a_devices_link_completes_the_header_record_and_begins_the_image_with_it(self):
        platform = {name: 0x40000000 + 16 * i for i, name in enumerate(sorted(self.elf.undefined))}
        with tempfile.TemporaryDirectory() as folder:
            linked = pathlib.Path(folder) / "device.ta"
            subprocess.run([LINKER, "-T", SCRIPT, "--gc-sections", "-z", "max-page-size=4096", "-o", linked, OBJECT,
                            *(f"--undefined={name}" for name in OFFERED),
                            *(f"--defsym={name}={address}" for name, address in platform.items())], check=True)
            device = Elf(linked)
        self.assertEqual(device.undefined, set())
        self.assertEqual(first_bytes_loaded(device, 36),
                         header_record(*(platform[name] for name in names.ENTRY_LAYER)))
        self.assertEqual(set(OFFERED) - device.defined, set())
        self.assertGreater(device.sections[".text"].size, CODE_AND_CONSTANTS // 2)


if __name__ == "__main__":
    IMAGE, OBJECT = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
    LINKER, SCRIPT = sys.argv[3], sys.argv[4]
    unittest.main(argv=sys.argv[:1], verbosity=2)
