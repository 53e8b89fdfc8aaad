#!/usr/bin/env python3
"""Projects of other people find the installed libraries, with CMake and with pkg-config, build with them and run.

usage: outside_project_test.py SOURCE BUILD
"""
import pathlib
import shlex
import shutil

import install_case
from install_case import InstalledTest, run

OUTSIDE = pathlib.Path(__file__).resolve().parent / "outside"


class OutsideProject(InstalledTest):
    def build_with_cmake(self, project, *arguments, check=True):
        """Builds a copy of the project, so that nothing around it can help; gives the build's folder."""
        copy = self.folder / "project"
        shutil.copytree(project, copy)
        configured = run("cmake", "-G", "Ninja", "-S", copy, "-B", copy / "build",
                         f"-DCMAKE_PREFIX_PATH={self.prefix}", *arguments, check=check)
        if configured.returncode == 0:
            run("cmake", "--build", copy / "build")
        return configured if not check else copy / "build"

    def flags(self, package):
        folder = next(self.prefix.glob("lib*/**/pkgconfig"))
        return shlex.split(run("pkg-config", "--cflags", "--libs", package, PKG_CONFIG_PATH=str(folder)).stdout)

    def folder_of_libraries(self):
        return str(next(self.prefix.glob("lib*/**/libtee_client_api.so")).parent)

    def assert_signs(self, program, **environment):
        """The first client's signature is one, says somebody who knows nothing of it."""
        message, signature, public_key = (self.folder / name for name in ("message", "signature", "public.der"))
        message.write_bytes(bytes(range(256)) * 1000)  # several updates
        told = run(program, message, signature, public_key, KEYMASTER_TEE=self.tee, **environment)
        self.assertIn("algorithms: 1 32 3 128\n", told.stdout)
        judge = ("openssl", "dgst", "-sha256", "-verify", public_key, "-keyform", "DER", "-signature", signature)
        self.assertIn("Verified OK", run(*judge, message).stdout)
        message.write_bytes(b"another")
        self.assertNotEqual(run(*judge, message, check=False).returncode, 0)

    def assert_outside_works(self, program, **environment):
        told = run(program, self.tee, **environment)
        self.assertEqual(told.stdout, "4 algorithms\nverified\nrefused: -30\n")

    def test_the_example_builds_with_cmake_and_without_the_headers_of_openssl(self):
        build = self.build_with_cmake(self.source / "example", "-DCMAKE_DISABLE_FIND_PACKAGE_OpenSSL=ON")
        self.assert_signs(build / "first_client")

    def test_the_example_is_installed_as_it_is_tested(self):
        examples = self.prefix / "share/doc/keymaster-ta-dev/examples"
        self.assert_signs(self.build_with_cmake(examples) / "first_client")

    def test_the_example_builds_with_pkg_config_and_strict_warnings(self):
        program = self.folder / "first_client"
        run("cc", "-std=c11", "-Wall", "-Wextra", "-Wpedantic", "-Werror", self.source / "example/first_client.c",
            *self.flags("keymaster-tee-client"), "-o", program)
        self.assert_signs(program, LD_LIBRARY_PATH=self.folder_of_libraries())

    def test_a_program_in_cxx_builds_with_cmake(self):
        self.assert_outside_works(self.build_with_cmake(OUTSIDE) / "outside")

    def test_a_program_in_cxx_builds_with_pkg_config(self):
        program = self.folder / "outside"
        run("c++", "-std=c++20", "-Wall", "-Wextra", "-Werror", OUTSIDE / "outside.cpp",
            *self.flags("keymaster-client"), "-o", program)
        self.assert_outside_works(program, LD_LIBRARY_PATH=self.folder_of_libraries())

    def test_another_version_than_the_installed_one_is_refused(self):
        project = self.folder / "asking"
        for version, accepted in (("0.1", True), ("0.1.0", True), ("0.2", False), ("1.0", False), ("0.0.9", False)):
            shutil.rmtree(project, ignore_errors=True)
            project.mkdir()
            (project / "CMakeLists.txt").write_text(
                "cmake_minimum_required(VERSION 3.25)\nproject(asking LANGUAGES C)\n"
                f"find_package(KeymasterTA {version} REQUIRED COMPONENTS tee_client_api)\n", encoding="utf-8")
            done = run("cmake", "-S", project, "-B", project / "build", f"-DCMAKE_PREFIX_PATH={self.prefix}",
                       check=False)
            self.assertEqual(done.returncode == 0, accepted, f"{version}: {done.stdout}")

    def test_an_unknown_component_is_refused(self):
        shutil.copytree(OUTSIDE, self.folder / "copy")
        lists = self.folder / "copy/CMakeLists.txt"
        lists.write_text(lists.read_text(encoding="utf-8").replace("REQUIRED", "REQUIRED COMPONENTS nothing"), "utf-8")
        told = self.build_with_cmake(self.folder / "copy", check=False)
        self.assertNotEqual(told.returncode, 0)
        self.assertIn("has no component nothing", " ".join(told.stdout.split()))


if __name__ == "__main__":
    install_case.main(__doc__)
