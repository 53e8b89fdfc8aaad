#!/usr/bin/env python3
"""An installation is whole, can be moved, and knows nothing of the build it came from.

usage: installed_files_test.py SOURCE BUILD
"""
import pathlib
import re
import subprocess
import sys
import time

import install_case
from install_case import InstalledTest, run

LIBRARIES = {"libtee_client_api.so.0": "TEE_CLIENT_API_1.0", "libhosted_tee.so.0": "HOSTED_TEE_1",
             "libkeymaster_client.so.0.1": "KEYMASTER_CLIENT_0.1"}
TAS = {"fbacea43-f475-4df3-866f-76256aba994f", "d625ee97-fb6f-4498-b282-a3f85d9413c5",
       "e8a03a08-6449-45b2-b275-9b2df5dd553b", "c45dc7dc-4431-4648-ba1e-28d7b155718e"}
PROTOTYPE = re.compile(r"^(?:TEEC_Result|void) (TEEC_\w+)\(", re.MULTILINE)


class InstalledFiles(InstalledTest):
    def installed_library(self, name):
        return next(self.prefix.glob(f"lib*/**/{name}"))

    def exports(self, name):
        """The demangled names that a library defines, each with the version it has."""
        lines = run("nm", "-DC", "--defined-only", self.installed_library(name)).stdout.splitlines()
        names = [re.sub(r"^\S* ?\S ", "", line.strip()) for line in lines]
        return [name.rpartition("@@")[::2] for name in names if "@@" in name]

    def test_the_command_works_wherever_the_tree_was_moved_to(self):
        blob = self.folder / "key.blob"
        told = run(self.prefix / "bin/kmctl", "--tee", self.tee, "generate", "--algorithm", "ec", blob)
        self.assertIn("Generated EC-256 key", told.stdout)
        state = run(self.prefix / "bin/kmctl", "--tee", self.tee, "device", "status")  # the provisioning TA's
        self.assertIn("locked", state.stdout)

    def test_the_server_serves_wherever_the_tree_was_moved_to(self):
        place = self.folder / "tee.sock"
        server = subprocess.Popen([self.prefix / "bin/teed", "--state", self.folder / "state", "--socket", place])
        self.addCleanup(server.kill)
        while not place.exists():
            self.assertIsNone(server.poll(), "the server has ended")
            time.sleep(0.01)
        told = run(self.prefix / "bin/kmctl", "--tee", f"unix:{place}", "generate", "--algorithm", "ec",
                   self.folder / "key.blob")
        self.assertIn("Generated EC-256 key", told.stdout)
        run(self.prefix / "bin/kmctl", "--tee", f"unix:{place}", "tee", "stop")
        self.assertEqual(server.wait(), 0)

    def test_the_images_are_those_beside_the_library_and_no_others(self):
        images = next(self.prefix.glob("lib*/**/ta"))
        self.assertEqual({image.stem for image in images.iterdir()}, TAS)
        hidden = images.with_name("hidden")
        images.rename(hidden)
        try:
            told = run(self.prefix / "bin/kmctl", "--tee", self.tee, "info", check=False)
        finally:
            hidden.rename(images)
        self.assertEqual(told.returncode, 5, told.stdout)
        self.assertIn("the TEE has no image", told.stdout)

    def test_no_file_mentions_the_build_or_the_sources(self):
        for file in self.prefix.rglob("*"):
            if file.is_file() and not file.is_symlink():
                content = file.read_bytes()
                for folder in (self.source, self.build):
                    self.assertFalse(str(folder.resolve()).encode() in content, f"{file} names {folder}")

    def test_the_client_api_exports_what_its_header_declares_and_nothing_else(self):
        declared = PROTOTYPE.findall((self.prefix / "include/keymaster/tee_client_api.h").read_text(encoding="utf-8"))
        self.assertEqual(len(declared), 9)
        self.assertEqual(sorted(name for name, _ in self.exports("libtee_client_api.so.0")), sorted(declared))

    def test_the_hosted_tee_exports_the_platforms_calls_and_keeps_its_own_for_this_build(self):
        exported = self.exports("libhosted_tee.so.0")
        calls = {name for name, version in exported if version == "HOSTED_TEE_1"}
        images = self.prefix.rglob("*.ta")
        wanted = {line.split()[-1] for image in images
                  for line in run("nm", "-D", "--undefined-only", image).stdout.splitlines()}
        self.assertEqual(wanted - calls, {"memcmp", "memcpy", "memmove", "memset", "strlen"} & wanted)
        self.assertEqual({name for name in calls if not name.startswith(("TEE_", "tee_entry_"))},
                         {"GetBootSeed", "tee_trace"})
        for name, version in exported:
            if version != "HOSTED_TEE_1":
                self.assertRegex(version, r"^HOSTED_TEE_PRIVATE_\d+\.\d+\.\d+$")
                self.assertRegex(name, r"^((typeinfo|typeinfo name|vtable) for )?hosted_tee::")

    def test_the_client_library_exports_its_own_namespace_and_nothing_else(self):
        exported = self.exports("libkeymaster_client.so.0.1")
        self.assertGreater(len(exported), 50)
        for name, _ in exported:
            self.assertRegex(name, r"^((typeinfo|typeinfo name|vtable) for )?keymaster::client::")

    def test_every_library_has_its_name_and_a_version(self):
        for name, version in LIBRARIES.items():
            told = run("readelf", "-dV", "-W", self.installed_library(name)).stdout
            self.assertRegex(told, rf"Library soname: \[{re.escape(name)}\]")
            self.assertIn(f"Name: {version}", told)
            self.assertNotRegex(told, r"TEXTREL")

    def test_nobody_can_link_with_the_hosted_tee_itself(self):
        self.assertEqual([file.name for file in self.prefix.rglob("libhosted_tee.so")], [])

    def test_every_header_stands_on_its_own(self):
        headers = sorted((self.prefix / "include").rglob("*.h"))
        self.assertGreater(len(headers), 20)
        for header in headers:
            named = header.relative_to(self.prefix / "include")
            compilers = [("c++", "-std=c++20", "c++")]
            if header.name == "tee_client_api.h":
                compilers += [("cc", "-std=c99", "c"), ("cc", "-std=c11", "c"), ("c++", "-std=c++11", "c++")]
            for compiler, standard, language in compilers:
                program = self.folder / "program"
                program.write_text(f"#include <{named}>\n#include <{named}>\n", encoding="utf-8")
                run(compiler, standard, "-Wall", "-Wextra", "-Wpedantic", "-Werror", "-fsyntax-only", "-x", language,
                    "-I", self.prefix / "include", program)

    def test_a_program_that_loads_the_library_as_a_plug_in_reaches_the_ta(self):
        library = self.installed_library("libtee_client_api.so.0")
        told = run(sys.executable, "-B", pathlib.Path(__file__).with_name("plug_in.py"), library, self.tee)
        self.assertEqual(told.stdout, "the TA has 4 algorithms\n")

    def test_each_component_installs_its_own_part(self):
        parts = {}
        for component in ("runtime", "development"):
            install_case.install(self.build, self.folder / component, "--component", component)
            parts[component] = {file.relative_to(self.folder / component) for file in
                                (self.folder / component).rglob("*") if not file.is_dir()}
        whole = {file.relative_to(self.prefix) for file in self.prefix.rglob("*") if not file.is_dir()}
        self.assertEqual(parts["runtime"] | parts["development"], whole)
        self.assertEqual(parts["runtime"] & parts["development"], set())
        for file in parts["runtime"]:
            self.assertNotIn(file.suffix, (".h", ".cmake", ".pc", ".so", ".c"), file)
        run(self.folder / "runtime/bin/kmctl", "--tee", self.tee, "info")


if __name__ == "__main__":
    install_case.main(__doc__)
