#!/usr/bin/env python3
"""The Debian packages are sound, and what they say they depend on is all they need.

usage: packages_test.py SOURCE BUILD

No network is asked: the clean root is made of the files that this system has of the packages which keymaster-ta depends
on, directly or not, and of nothing else. tools/check-packages installs them with apt in a root fresh from the archive.
"""
import os
import pathlib
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

TOOLS = ("cpack", "dpkg-deb", "dpkg-shlibdeps", "dpkg-query", "ldconfig", "pkg-config", "openssl")
SKIPPED = 77


def run(*command, check=True, cwd=None, environment=None):
    done = subprocess.run([str(word) for word in command], text=True, check=False, cwd=cwd, env=environment,
                          stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    if check and done.returncode != 0:
        raise AssertionError(f"{command}: exit code {done.returncode}\n{done.stdout}")
    return done


def field(package, name):
    return run("dpkg-deb", "-f", package, name).stdout.strip()


def names_of(depends):
    """The packages of a Depends field; of alternatives the first."""
    return [re.split(r"[ :(|]", part.strip())[0] for part in depends.split(",") if part.strip()]


def closure_of(names):
    """The packages, and all that they depend on in turn, as this system has them installed."""
    found, waiting = set(), list(names)
    while waiting:
        name = waiting.pop()
        if name in found:
            continue
        status = run("dpkg-query", "-W", "-f", "${db:Status-Status} ${Pre-Depends}, ${Depends}", name, check=False)
        if status.returncode != 0 or not status.stdout.startswith("installed "):
            raise unittest.SkipTest(f"{name}, which the package depends on, is not installed here")
        found.add(name)
        waiting += names_of(status.stdout.partition(" ")[2])
    return found


def copy_package(name, root):
    for line in run("dpkg-query", "-L", name).stdout.splitlines():
        # A system whose /lib is a link to usr/lib has a root of the same shape.
        source = pathlib.Path(os.path.realpath(os.path.dirname(line)), os.path.basename(line))
        target = root / str(source).lstrip("/")
        if source.is_symlink():
            target.parent.mkdir(parents=True, exist_ok=True)
            if not target.is_symlink() and not target.exists():
                target.symlink_to(os.readlink(source))
        elif source.is_file():
            target.parent.mkdir(parents=True, exist_ok=True)
            shutil.copy2(source, target)


def can_enter_roots():
    tried = run("unshare", "--map-root-user", "--mount", "--pid", "--fork", "--mount-proc", "true", check=False)
    return tried.returncode == 0


class Packages(unittest.TestCase):
    source = build = packages = None

    @classmethod
    def setUpClass(cls):
        folder = tempfile.TemporaryDirectory(prefix="keymaster-packages-")
        cls.addClassCleanup(folder.cleanup)
        cls.packages = pathlib.Path(folder.name)
        run("cpack", "-G", "DEB", "-B", cls.packages, cwd=cls.build)
        cls.runtime, = cls.packages.glob("keymaster-ta_*.deb")
        cls.development, = cls.packages.glob("keymaster-ta-dev_*.deb")

    def unpack(self, package):
        tree = pathlib.Path(tempfile.mkdtemp(dir=self.packages))
        run("dpkg-deb", "-x", package, tree)
        return tree

    def test_the_packages_depend_on_what_they_are_linked_with_and_on_each_other(self):
        self.assertEqual(set(names_of(field(self.runtime, "Depends"))),
                         {"libc6", "libfmt9", "libgcc-s1", "libsqlite3-0", "libssl3", "libstdc++6"})
        version = field(self.runtime, "Version")
        self.assertIn(f"keymaster-ta (= {version})", field(self.development, "Depends"))

    def test_no_library_or_program_keeps_a_search_path(self):
        tree = self.unpack(self.runtime)
        for file in [*tree.glob("usr/bin/*"), *tree.glob("usr/lib/**/*.so.*"), *tree.glob("usr/lib/**/*.ta")]:
            self.assertNotRegex(run("readelf", "-d", file).stdout, "R(UN)?PATH", file)

    def test_pages_and_changes_are_compressed_and_there_is_a_copyright(self):
        for package in (self.runtime, self.development):
            tree = self.unpack(package)
            documents = tree / "usr/share/doc" / field(package, "Package")
            self.assertTrue({"copyright", "changelog.Debian.gz", "changelog.gz"} <=
                            {file.name for file in documents.iterdir()})
            self.assertEqual([page for page in tree.glob("usr/share/man/*/*") if page.suffix != ".gz"], [])

    @unittest.skipIf(shutil.which("lintian") is None, "lintian is not installed")
    def test_lintian_has_nothing_to_say(self):
        told = run("lintian", "--fail-on", "error,warning", "--allow-root", self.runtime, self.development, check=False)
        self.assertEqual((told.returncode, told.stdout), (0, ""))

    def clean_root(self):
        """A root with what the runtime package depends on, and with it."""
        root = pathlib.Path(tempfile.mkdtemp(dir=self.packages))
        for name in ("usr/lib", "usr/lib64", "usr/bin", "usr/sbin", "proc", "tmp", "etc"):
            (root / name).mkdir(parents=True)
        for name in ("lib", "lib64", "bin", "sbin"):
            (root / name).symlink_to(f"usr/{name}")
        for name in closure_of(names_of(field(self.runtime, "Depends"))):
            copy_package(name, root)
        run("dpkg-deb", "-x", self.runtime, root)
        run("ldconfig", "-r", root)  # what the package's trigger does
        return root

    @unittest.skipIf(shutil.which("unshare") is None or not can_enter_roots(), "no root can be entered here")
    def test_the_commands_run_in_a_root_with_their_dependencies_and_nothing_else(self):
        root = self.clean_root()
        environment = {"PATH": os.environ["PATH"], "HOME": "/tmp", "LC_ALL": "C.UTF-8"}

        def entering(*command):
            return ["unshare", "--map-root-user", "--mount", "--pid", "--fork", "--kill-child",
                    f"--mount-proc={root / 'proc'}", "chroot", root, *command]

        def inside(*command, check=True):
            return run(*entering(*command), check=check, environment=environment)

        self.assertFalse((root / "usr/bin/sh").exists())  # no more than what was promised
        told = inside("/usr/bin/kmctl", "generate", "--size", "1024", "/tmp/key")
        self.assertIn("Generated RSA-1024 key", told.stdout)
        inside("/usr/bin/kmctl", "sign", "/tmp/key", "/usr/bin/kmctl", "-o", "/tmp/signature")
        inside("/usr/bin/kmctl", "verify", "/tmp/key", "/tmp/signature", "/usr/bin/kmctl")
        wrong = inside("/usr/bin/kmctl", "verify", "/tmp/key", "/tmp/signature", "/tmp/key", check=False)
        self.assertEqual(wrong.returncode, 6, wrong.stdout)
        self.assertIn("locked", inside("/usr/bin/kmctl", "device", "status").stdout)

        # And so do the server, kmctl through it, and a program of somebody who has the development package too.
        run("dpkg-deb", "-x", self.development, root)
        folder, = root.glob("usr/lib/**/pkgconfig")
        flags = run("pkg-config", "--cflags", "--libs", "keymaster-tee-client", environment={
            **environment, "PKG_CONFIG_LIBDIR": str(folder), "PKG_CONFIG_SYSROOT_DIR": str(root)}).stdout.split()
        example = self.source / "example/first_client.c"
        # The linker looks for libraries of libraries in the system's own places, and not in this root's.
        run("cc", "-std=c11", example, "-o", root / "tmp/first_client", *flags,
            f"-Wl,-rpath-link,{folder.parent}")
        teed = subprocess.Popen([str(word) for word in entering("/usr/bin/teed", "--state", "/tmp/state", "--socket",
                                                                "/tmp/tee")],
                                env=environment, stderr=subprocess.PIPE, text=True)
        self.addCleanup(teed.stderr.close)
        self.addCleanup(teed.wait)
        self.addCleanup(teed.kill)
        self.assertIn("serving", teed.stderr.readline())
        through = ("/usr/bin/kmctl", "--tee", "unix:/tmp/tee")
        self.assertIn("Generated", inside(*through, "generate", "--size", "1024", "/tmp/key2").stdout)
        environment["KEYMASTER_TEE"] = "unix:/tmp/tee"
        inside("/tmp/first_client", "/usr/bin/kmctl", "/tmp/signature2", "/tmp/public")
        run("openssl", "dgst", "-sha256", "-verify", root / "tmp/public", "-keyform", "DER", "-signature",
            root / "tmp/signature2", root / "usr/bin/kmctl")
        inside(*through, "tee", "stop")
        self.assertEqual(teed.wait(timeout=60), 0)


if __name__ == "__main__":
    if len(sys.argv) < 3:
        sys.exit(__doc__)
    MISSING = [tool for tool in TOOLS if shutil.which(tool, path=os.environ["PATH"] + ":/usr/sbin:/sbin") is None]
    if MISSING:
        print(f"skipped: there is no {', '.join(MISSING)}")
        sys.exit(SKIPPED)
    os.environ["PATH"] += ":/usr/sbin:/sbin"
    Packages.source = pathlib.Path(sys.argv[1])
    Packages.build = sys.argv[2]
    unittest.main(argv=[sys.argv[0], *sys.argv[3:]], verbosity=1)
