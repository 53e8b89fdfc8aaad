"""Holds the checks of the sources to their rules: each finds what it must find in a made-up source tree, and nothing
in the same tree without the fault.

usage: source_checks_test.py TOOLS_FOLDER
"""
import importlib.machinery
import importlib.util
import json
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest


def run(check, root):
    return subprocess.run([sys.executable, "-B", str(TOOLS / check), root], capture_output=True, text=True, check=False)


HEADERS = [
    "src/ta/dispatch.h", "src/ta/algorithm_registry.h", "src/params/marshal.h", "src/params/keymaster_defs.h",
    "src/params/keymaster_protocol.h", "src/keystore/key_blob.h", "src/auth/authorization.h",
    "src/algorithms/rsa/rsa_key_data.h", "src/algorithms/rsa/rsa_sign.h", "src/algorithms/aes/aes_key.h",
    "src/soter/soter_init.h", "src/quil/quil.h", "src/platform/cursor.h", "tee/include/tee_internal_api.h",
    "tee/include/tee_internal_api_extensions.h", "tee/include/tee_ta_image.h", "tee/include/tee_client_api.h",
    "tee/runtime/instance.h", "tee/client/connection.h", "tee/client/device_information.h",
    "tee/companions/quil_ta.h", "client/lib/session.h",
]

# A file, an include in it, and whether the layers allow it.
INCLUDES = [
    ("src/ta/begin.cpp", '"auth/authorization.h"', True),
    ("src/ta/ta_head.cpp", '"tee_ta_image.h"', True),
    ("src/ta/begin.cpp", '"tee_client_api.h"', False),
    ("src/params/marshal.cpp", '"platform/cursor.h"', True),
    ("src/params/marshal.cpp", '"keystore/key_blob.h"', False),
    ("src/keystore/save_key.cpp", '"params/marshal.h"', True),
    ("src/keystore/save_key.cpp", '"ta/dispatch.h"', False),
    ("src/auth/use_log.cpp", '"ta/algorithm_registry.h"', True),
    ("src/auth/use_log.cpp", '"ta/dispatch.h"', False),
    ("src/auth/use_log.cpp", '"keystore/key_blob.h"', False),
    ("src/algorithms/rsa/rsa_sign.cpp", '"soter/soter_init.h"', True),
    ("src/algorithms/rsa/rsa_sign.cpp", '"algorithms/aes/aes_key.h"', False),
    ("src/algorithms/aes/aes_key.cpp", '"algorithms/aes/aes_key.h"', True),
    ("src/algorithms/aes/aes_key.cpp", '"soter/soter_init.h"', False),
    ("src/algorithms/ec/ec_key.cpp", '"keystore/key_blob.h"', False),
    ("src/algorithms/hmac/hmac_key.cpp", '"auth/authorization.h"', False),
    ("src/soter/resolve_key.cpp", '"algorithms/rsa/rsa_key_data.h"', True),
    ("src/soter/resolve_key.cpp", '"algorithms/rsa/rsa_sign.h"', False),
    ("src/soter/soter_init.cpp", '"quil/quil.h"', True),
    ("src/quil/quil.cpp", '"params/marshal.h"', False),
    ("src/platform/cursor.h", '"params/marshal.h"', False),
    ("src/platform/trace.h", '"tee_internal_api_extensions.h"', True),
    ("src/platform/trace.h", '"tee_ta_image.h"', False),
    ("src/platform/trace.h", '"tee/runtime/instance.h"', False),
    ("src/params/marshal.cpp", "<span>", True),
    ("src/params/marshal.cpp", "<vector>", False),
    ("src/params/marshal.cpp", "<string.h>", False),
    ("src/stray.cpp", '"platform/cursor.h"', False),
    ("tee/include/tee_internal_api.h", '"tee_ta_image.h"', True),
    ("tee/include/tee_internal_api.h", '"tee/runtime/instance.h"', False),
    ("tee/include/tee_internal_api.h", "<string>", False),
    ("tee/runtime/world.cpp", '"tee_internal_api.h"', True),
    ("tee/runtime/world.cpp", "<vector>", True),
    ("tee/runtime/world.cpp", '"src/params/marshal.h"', False),
    ("tee/companions/quil_ta.cpp", '"tee_internal_api.h"', True),
    ("tee/companions/quil_ta.cpp", '"tee/runtime/instance.h"', False),
    ("client/lib/session.cpp", '"tee_client_api.h"', True),
    ("client/lib/session.cpp", '"src/params/keymaster_defs.h"', True),
    ("client/lib/session.cpp", '"src/params/marshal.h"', False),
    ("client/lib/session.cpp", '"tee_internal_api.h"', False),
    ("client/lib/session.cpp", '"tee/runtime/instance.h"', False),
    ("client/lib/session.cpp", '"tee/client/device_information.h"', True),
    ("client/lib/session.cpp", '"tee/client/connection.h"', False),
]

# A file, a line of code in it, and whether it may stand there.
LINES = [
    ("src/ta/a.cpp", "auto* p = new uint8_t[4];", False),
    ("src/ta/a.cpp", "auto* p = new (memory) record();", False),
    ("src/platform/a.h", "auto* p = new (memory) record();", True),
    ("src/ta/a.cpp", "delete p;", False),
    ("src/ta/a.cpp", "a(const a&) = delete;", True),
    ("src/ta/a.cpp", "void* p = malloc(4);", False),
    ("src/ta/a.cpp", "std::free(p);", False),
    ("src/ta/a.cpp", "old->free(old);", True),
    ("src/ta/a.cpp", "rsa_sign_free(old);", True),
    ("src/ta/a.cpp", "void* p = TEE_Malloc(4, 0);", False),
    ("src/params/a.cpp", "void* p = TEE_Malloc(4, 0);", True),
    ("src/keystore/a.cpp", "TEE_Free(p);", False),
    ("src/ta/a.cpp", "TEE_FreeOperation(op);", False),
    ("src/ta/a.cpp", "std::vector<int> v;", False),
    ("src/ta/a.cpp", "std::string s;", False),
    ("src/ta/a.cpp", "std::string_view s;", True),
    ("src/ta/a.cpp", "goto out;", False),
    ("src/ta/a.cpp", "throw 1;", False),
    ("src/ta/a.cpp", "dynamic_cast<a&>(b);", False),
    ("src/ta/a.cpp", "assert(p);", False),
    ("src/ta/a.cpp", "static_assert(true);", True),
    ("src/ta/a.cpp", "TEE_Panic(0);", False),
    ("src/ta/a.cpp", 'printf("x");', False),
    ("src/ta/a.cpp", 'TRACE_ERROR("new delete goto malloc(4) throw");', True),
    ("src/ta/a.cpp", "// the new key; goto the end; malloc(4)", True),
    ("src/ta/a.cpp", "if (memcmp(a, b, 4) == 0) return;", False),
    ("src/ta/a.cpp", 'asm volatile("");', False),
    ("src/platform/a.h", 'asm volatile("");', True),
    ("src/ta/a.cpp", 'tee_trace("f", 1, 1, "x");', False),
    ("src/ta/a.cpp", "const_cast<char*>(p);", False),
    ("src/ta/a.cpp", "double d = 0;", False),
    ("src/ta/a.cpp", "const uint32_t n = 1'000'000; goto out;", False),
    ("tee/runtime/a.cpp", "goto out;", True),
    ("tee/runtime/a.cpp", "// TODO: later", False),
    ("client/lib/a.cpp", "f();  // NOLINT", False),
    ("client/lib/a.cpp", "f();  // NOLINT(check-name)", False),
    ("client/lib/a.cpp", "f();  // NOLINT(check-name): the standard's name", True),
    ("client/lib/a.cpp", "using namespace std;", False),
]


def load(name):
    """The tool as a module; it has no suffix, as a command has none."""
    loader = importlib.machinery.SourceFileLoader(name.replace("-", "_"), str(TOOLS / name))
    module = importlib.util.module_from_spec(importlib.util.spec_from_loader(loader.name, loader))
    loader.exec_module(module)
    return module


class SourceChecks(unittest.TestCase):
    @staticmethod
    def findings(tool, path, line):
        with tempfile.TemporaryDirectory() as root:
            for header in HEADERS:
                (pathlib.Path(root) / header).parent.mkdir(parents=True, exist_ok=True)
                (pathlib.Path(root) / header).touch()
            file = pathlib.Path(root) / path
            file.parent.mkdir(parents=True, exist_ok=True)
            file.write_text(f"// first line\n{line}\n", encoding="utf-8")
            return tool.check(pathlib.Path(root))

    def hold(self, name, table, make_line):
        tool = load(name)
        for path, text, allowed in table:
            with self.subTest(tool=name, path=path, text=text):
                found = self.findings(tool, path, make_line(text))
                self.assertEqual(bool(found), not allowed, found)
                self.assertTrue(all(finding.startswith(f"{path}:2: ") for finding in found), found)

    def test_each_arrow_between_layers_is_judged_as_drawn(self):
        self.hold("check-includes", INCLUDES, lambda text: f"#include {text}")

    def test_an_include_that_leads_nowhere_is_a_fault(self):
        found = self.findings(load("check-includes"), "client/lib/a.cpp", '#include "nowhere.h"')
        self.assertEqual(len(found), 1)
        self.assertIn("not found", found[0])

    def test_a_fault_makes_the_command_fail(self):
        with tempfile.TemporaryDirectory() as root:
            (pathlib.Path(root) / "src").mkdir()
            (pathlib.Path(root) / "src/a.cpp").write_text('#include "nowhere.h"\nvoid f() { goto out; }\n', "utf-8")
            for name in ("check-includes", "check-banned"):
                result = run(name, root)
                self.assertEqual(result.returncode, 1, result.stderr)
                self.assertIn("src/a.cpp:", result.stdout)

    @unittest.skipIf(shutil.which("clang-format") is None, "clang-format is not installed")
    def test_a_file_that_is_not_formatted_is_named(self):
        with tempfile.TemporaryDirectory() as root:
            (pathlib.Path(root) / "src").mkdir()
            shutil.copy(TOOLS.parent / ".clang-format", root)
            (pathlib.Path(root) / "src/good.cpp").write_text("int f() {\n  return 1;\n}\n", "utf-8")
            self.assertEqual(run("check-format", root).returncode, 0)
            (pathlib.Path(root) / "src/bad.cpp").write_text("int f()\n{return 1;}\n", "utf-8")
            found = run("check-format", root)
            self.assertEqual(found.returncode, 1)
            self.assertIn("src/bad.cpp: not formatted", found.stdout)
            self.assertNotIn("good.cpp", found.stdout)

    @unittest.skipIf(shutil.which("run-clang-tidy") is None, "clang-tidy is not installed")
    def test_a_finding_of_clang_tidy_is_shown_once(self):
        with tempfile.TemporaryDirectory() as root:
            tree, build = pathlib.Path(root).resolve(), pathlib.Path(root).resolve() / "build"
            for folder in ("src", "tools", "build"):
                (tree / folder).mkdir()
            shutil.copy(TOOLS / "check-tidy", tree / "tools")
            (tree / ".clang-tidy").write_text("Checks: '-*,modernize-use-nullptr'\nHeaderFilterRegex: '.*'\n", "utf-8")
            units = [tree / "src/a.cpp", tree / "src/b.cpp"]
            for unit in units:
                unit.write_text('#include "p.h"\n', "utf-8")
            (build / "compile_commands.json").write_text(json.dumps(
                [{"directory": str(tree), "file": str(unit), "command": f"c++ -c {unit}"} for unit in units]), "utf-8")
            for pointer, status in (("nullptr", 0), ("0", 1)):
                (tree / "src/p.h").write_text(f"inline int* p() {{ return {pointer}; }}\n", "utf-8")
                found = subprocess.run([sys.executable, "-B", tree / "tools/check-tidy", build], capture_output=True,
                                       text=True, check=False)
                self.assertEqual(found.returncode, status, found.stdout + found.stderr)
                self.assertEqual(found.stdout.count("modernize-use-nullptr"), status)

    def test_each_banned_pattern_is_found_and_its_look_alikes_are_not(self):
        self.hold("check-banned", LINES, lambda text: text)


if __name__ == "__main__":
    TOOLS = pathlib.Path(sys.argv[1])
    unittest.main(argv=sys.argv[:1], verbosity=2)
