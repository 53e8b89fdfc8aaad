"""What a linked TA image asks of its loader and offers to it, read with readelf.

usage: image_test.py IMAGE HEADER_FOLDER [companion]

IMAGE is `<uuid>.ta`; HEADER_FOLDER holds the headers of the TEE, so that the lists here cannot drift away from them. A
companion may use whatever those headers declare.
"""
import pathlib
import re
import subprocess
import sys
import unittest
import uuid

# The platform's calls that today's commands of the Keymaster TA need: each must really be referenced by the image, or code that should be
# in it was dropped.
USED = {
    # heap, properties, clocks, random
    "TEE_Malloc", "TEE_Realloc", "TEE_Free", "TEE_GetPropertyAsUUID", "TEE_GetSystemTime", "TEE_GetREETime",
    "TEE_GenerateRandom",
    # keys
    "TEE_AllocateTransientObject", "TEE_FreeTransientObject", "TEE_PopulateTransientObject", "TEE_InitRefAttribute",
    "TEE_InitValueAttribute", "TEE_GenerateKey", "TEE_GetObjectBufferAttribute",
    # storage of the key storage key
    "TEE_OpenPersistentObject", "TEE_CreatePersistentObject", "TEE_ReadObjectData", "TEE_CloseObject",
    "TEE_CloseAndDeletePersistentObject1", "TEE_RPMB_MakeFileSystem",
    # operations: sealing, auth tokens, digests, RSA
    "TEE_AllocateOperation", "TEE_FreeOperation", "TEE_SetOperationKey", "TEE_AEInit", "TEE_AEUpdate",
    "TEE_AEEncryptFinal", "TEE_AEDecryptFinal", "TEE_MACInit", "TEE_MACComputeFinal", "TEE_DigestUpdate",
    "TEE_DigestDoFinal", "TEE_AsymmetricEncrypt", "TEE_AsymmetricDecrypt", "TEE_AsymmetricSignDigest",
    "TEE_AsymmetricVerifyDigest", "TEE_AsymmetricExport",
    # soter: properties, the counter, the provisioning TA
    "TEE_GetPropertyAsString", "TEE_GetPropertyAsIdentity", "TEE_WriteObjectData", "TEE_SeekObjectData",
    "TEE_OpenTASession", "TEE_InvokeTACommand", "TEE_CloseTASession",
    # the boot's secret, trace
    "GetBootSeed", "tee_trace",
}
# Calls that the TA may come to need, and any platform that runs it offers.
PERMITTED = {
    "TEE_MemMove", "TEE_MemFill", "TEE_CipherInit", "TEE_CipherUpdate", "TEE_CipherDoFinal", "TEE_AEUpdateAAD",
    "TEE_MACUpdate",
}
ENTRY_LAYER = ["tee_entry_open_session", "tee_entry_close_session", "tee_entry_invoke_command"]
# What a compiler calls on its own: the five that every freestanding environment has, and its arithmetic helpers.
COMPILER = re.compile(r"mem(?:cpy|move|set|cmp)|strlen|__aeabi_\w+|__(?:u?div|u?mod|u?divmod|ashl|ashr|lshr|mul|popcount|"
                      r"clz|ctz|bswap)[sdt]i[234]")
# Named one by one, although the allow-list leaves no room for them, so that a failure says what came in: libc, the C++
# run time, threads; calls that end the instance; and calls that some trusted OS does not have.
FORBIDDEN = re.compile(
    r"(?:m|c|re)alloc|free|\w*printf|puts|abort|exit|__stack_chk_\w+|_Z(?:n|d)[aw]?\w*|__cxa_\w+|__gxx_personality\w*|"
    r"_Unwind_\w+|__tls_get_addr|pthread_\w+|TEE_Panic|TEE_MemCompare|TEE_GetObjectInfo1?|TEE_CopyOperation|"
    r"TEE_CopyObjectAttributes1?|TEE_ResetOperation|TEE_ResetTransientObject|TEE_MACCompareFinal|"
    r"TEE_GetObjectValueAttribute|TEE_TruncateObjectData")
EXPORTED = {
    "ta_head", "ta_properties", "tee_trace_prefix", "TA_CreateEntryPoint", "TA_DestroyEntryPoint",
    "TA_OpenSessionEntryPoint", "TA_CloseSessionEntryPoint", "TA_InvokeCommandEntryPoint",
}


def readelf(*options):
    return subprocess.run(["readelf", "--wide", *options, str(IMAGE)], check=True, capture_output=True,
                          text=True).stdout


class Image(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.undefined, cls.defined = set(), set()
        for line in readelf("--dyn-syms").splitlines():
            # Num: Value Size Type Bind Vis Ndx Name
            fields = line.split()
            if len(fields) >= 8 and fields[0].rstrip(":").isdigit():
                (cls.undefined if fields[6] == "UND" else cls.defined).add(fields[7].split("@")[0])
        cls.sections = {}
        for line in readelf("--section-headers").splitlines():
            match = re.match(r"\s*\[\s*\d+\]\s+(\S+)\s+(\S+)\s+([0-9a-f]+)\s+([0-9a-f]+)\s+([0-9a-f]+)\s+\S+\s+(\S*)",
                             line)
            if match:
                name, kind, address, offset, size, flags = match.groups()
                cls.sections[name] = (kind, int(address, 16), int(offset, 16), int(size, 16), flags)
        cls.is_64_bit = "ELF64" in readelf("--file-header")

    def test_it_imports_nothing_but_the_platforms_calls_and_the_compilers_helpers(self):
        calls = DECLARED if IS_COMPANION else USED | PERMITTED | set(ENTRY_LAYER)
        self.assertEqual({name for name in self.undefined - calls if not COMPILER.fullmatch(name)}, set())

    def test_it_imports_no_forbidden_name(self):
        self.assertEqual({name for name in self.undefined if FORBIDDEN.fullmatch(name)}, set())

    def test_it_refers_to_every_call_that_its_commands_need(self):
        if IS_COMPANION:
            self.assertEqual(set(ENTRY_LAYER) - self.undefined, set())
            return
        self.assertEqual((USED | set(ENTRY_LAYER)) - self.undefined, set())

    def test_the_calls_listed_here_are_declared_by_the_tees_headers(self):
        self.assertEqual((USED | PERMITTED | set(ENTRY_LAYER)) - DECLARED, set())

    def test_it_exports_its_records_and_entry_points_and_nothing_else(self):
        self.assertEqual(self.defined, EXPORTED)

    def test_it_needs_no_other_library(self):
        self.assertNotIn("(NEEDED)", readelf("--dynamic"))

    def test_nothing_in_it_runs_before_the_entry_points(self):
        self.assertEqual([name for name in self.sections
                          if name.startswith((".init", ".fini", ".ctors", ".dtors", ".preinit_array"))], [])

    def test_it_has_no_thread_local_storage_and_no_exception_tables(self):
        self.assertEqual([name for name in self.sections if name.startswith((".tdata", ".tbss", ".gcc_except_table"))],
                         [])

    def test_no_part_of_it_is_both_writable_and_executable(self):
        segments = re.findall(r"^\s*(LOAD|GNU_STACK)\s.*\s(R?[ ]?W?[ ]?E?)\s+0x[0-9a-f]+$", readelf("--program-headers"),
                              re.MULTILINE)
        self.assertEqual({kind for kind, _ in segments}, {"LOAD", "GNU_STACK"})
        self.assertEqual([flags for _, flags in segments if "W" in flags and "E" in flags], [])
        self.assertNotIn("TEXTREL", readelf("--dynamic"))

    def test_the_header_record_stands_in_its_section_with_the_uuid_of_the_file(self):
        self.assertIn(".ta_head", self.sections)
        kind, _, offset, size, flags = self.sections[".ta_head"]
        self.assertEqual(kind, "PROGBITS")
        self.assertIn("A", flags)
        # UUID, stack size, flags, three entry pointers
        self.assertEqual(size, 16 + 4 + 4 + 3 * (8 if self.is_64_bit else 4))
        record = IMAGE.read_bytes()[offset:offset + size]
        # Field by field in the processor's order, as the standard's structure has it.
        self.assertEqual(uuid.UUID(bytes_le=record[:16]), uuid.UUID(IMAGE.stem))
        self.assertEqual(uuid.UUID(IMAGE.stem).version, 4)
        self.assertEqual(int.from_bytes(record[16:20], "little"), 8 * 1024)
        # user mode, executed from DDR, single instance, many sessions
        self.assertEqual(int.from_bytes(record[20:24], "little"), 0xF)

    def test_the_header_record_points_at_the_platforms_entry_layer(self):
        _, address, _, size, _ = self.sections[".ta_head"]
        pointers = {}
        for line in readelf("--relocs").splitlines():
            fields = line.split()
            if len(fields) >= 5 and re.fullmatch(r"[0-9a-f]+", fields[0]):
                place = int(fields[0], 16)
                if address <= place < address + size:
                    pointers[place - address] = fields[4]
        width = 8 if self.is_64_bit else 4
        self.assertEqual(pointers, {24 + i * width: name for i, name in enumerate(ENTRY_LAYER)})


if __name__ == "__main__":
    IMAGE, HEADERS = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
    IS_COMPANION = sys.argv[3:] == ["companion"]
    DECLARED = {name for path in HEADERS.glob("*.h")
                for name in re.findall(r"\b(\w+)\(", path.read_text(encoding="utf-8"))}
    unittest.main(argv=sys.argv[:1], verbosity=2)
