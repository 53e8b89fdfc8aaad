"""Holds tools/stack-budget to what it promises, on small programs that this test writes and GCC compiles. What a path
takes is summed up here from GCC's own listing of frames (-fstack-usage).

usage: stack_budget_test.py TOOL COMPILER OBJDUMP
"""
import json
import pathlib
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

PLATFORM = r"TEE_\w+"
# Each function keeps something on the stack across a call, so that it has a frame and no call becomes a jump.
PRELUDE = """
void TEE_Use(void *bytes);
#define WORK(size) char work[size]; TEE_Use(work)
"""


class StackBudget(unittest.TestCase):
    def setUp(self):
        self.root = pathlib.Path(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.root)
        (self.root / "objects").mkdir()
        (self.root / "src").mkdir()
        self.table = {"entry_points": ["entry"], "platform": [PLATFORM], "calls": []}

    def compile(self, text, name="program.c", graph=True):
        (self.root / "src" / name).write_text(PRELUDE + text, encoding="utf-8")
        flags = ["-fcallgraph-info=su,da"] if graph else []
        subprocess.run([COMPILER, "-O1", "-fno-inline", "-fno-ipa-icf", "-fno-optimize-sibling-calls",
                        "-fno-stack-protector", "-ffunction-sections", "-fstack-usage", *flags,
                        "-c", f"src/{name}", "-o", f"objects/{name}.o"], cwd=self.root, check=True)

    def frame(self, function, name="program.c"):
        for line in (self.root / "objects" / f"{name}.su").read_text(encoding="utf-8").splitlines():
            place, size, _ = line.split("\t")
            if place.endswith(f":{function}"):
                return int(size)
        raise KeyError(function)

    def run_tool(self, *options):
        table = self.root / "table.json"
        table.write_text(json.dumps(self.table), encoding="utf-8")
        command = [sys.executable, "-B", str(TOOL), "objects", "--table", "table.json", "--root", ".", "--objdump", OBJDUMP]
        return subprocess.run([*command, *options], cwd=self.root, capture_output=True, text=True, check=False)

    def expect_no_bound(self, *words):
        answer = self.run_tool()
        self.assertEqual(answer.returncode, 2, answer.stdout + answer.stderr)
        for word in words:
            self.assertIn(word, answer.stdout)

    def test_the_deepest_of_several_paths_is_summed_up(self):
        self.compile("""
            void deep(void) { WORK(300); }
            void middle(void) { WORK(50); deep(); }
            void wide(void) { WORK(200); }
            void entry(void) { WORK(20); wide(); middle(); }
            """)
        answer = self.run_tool()
        self.assertEqual(answer.returncode, 0, answer.stdout + answer.stderr)
        expected = sum(map(self.frame, ["entry", "middle", "deep"]))
        self.assertGreater(expected, 370)
        self.assertIn(f"| `entry` | {expected} | `deep` |", answer.stdout)
        chain = [f"{name} ({self.frame(name)})" for name in ("entry", "middle", "deep")]
        self.assertIn(" -> ".join(chain), answer.stdout)

    def test_arguments_that_a_function_spills_are_part_of_its_frame(self):
        # On ARM the third word of a structure that begins in r3 comes on the stack, and the callee puts r3 before it.
        self.compile("""
            struct three { int a, b, c; };
            void take(struct three *t);
            void entry(int x, int y, int z, struct three t) {
              WORK(40);
              take(&t);
              work[0] = (char)(x + y + z);
              TEE_Use(work);
            }
            """)
        self.table["platform"].append("take")
        answer = self.run_tool()
        self.assertEqual(answer.returncode, 0, answer.stdout + answer.stderr)
        instructions = subprocess.run([OBJDUMP, "--disassemble", self.root / "objects/program.c.o"], check=True,
                                      capture_output=True, text=True).stdout
        spilled = 8 if re.search(r"sub\s+sp, #8\b", instructions) else 0
        self.assertIn(f"| `entry` | {self.frame('entry') + spilled} |", answer.stdout)
        if "arm" in COMPILER:
            self.assertEqual(spilled, 8, "GCC spills nothing here any more: this test tests nothing")

    def test_the_copies_of_an_inline_function_are_taken_for_the_worst(self):
        for name, size in (("program.c", 20), ("other.c", 900)):
            self.compile(f"""
                __attribute__((weak)) void copied(void) {{ WORK({size}); }}
                void {'entry' if size == 20 else 'unused'}(void) {{ WORK(20); copied(); }}
                """, name)
        self.assertIn(f"| `entry` | {self.frame('entry') + self.frame('copied', 'other.c')} |", self.run_tool().stdout)

    def test_objects_of_another_processor_are_no_bound(self):
        self.compile("void entry(void) { WORK(20); }")
        (self.root / "objects/program.c.o").write_bytes(b"no object at all")
        self.expect_no_bound("cannot read program.c.o")

    def test_a_path_crosses_objects(self):
        self.compile("void deep(void) { WORK(300); }", "other.c")
        self.compile("void deep(void); void entry(void) { WORK(20); deep(); }")
        self.assertIn(f"| `entry` | {self.frame('entry') + self.frame('deep', 'other.c')} |", self.run_tool().stdout)

    def test_functions_of_one_name_are_told_apart_by_their_files(self):
        self.compile("static void step(void) { WORK(900); } void entry(void) { WORK(20); step(); }")
        self.compile("static void step(void) { WORK(100); } void unused(void) { WORK(1000); step(); }", "other.c")
        self.assertIn(f"| `entry` | {self.frame('entry') + self.frame('step')} |", self.run_tool().stdout)

    def test_a_path_above_the_limit_fails(self):
        self.compile("void entry(void) { WORK(500); }")
        size = self.frame("entry")
        self.assertEqual(self.run_tool("--limit", str(size)).returncode, 0)
        answer = self.run_tool("--limit", str(size - 1))
        self.assertEqual(answer.returncode, 1)
        self.assertIn(f"above the limit of {size - 1} bytes", answer.stdout)

    def test_recursion_is_no_bound_and_the_circle_is_named(self):
        self.compile("""
            void again(int n);
            void once(int n) { WORK(20); again(n); }
            void again(int n) { WORK(20); if (n != 0) once(n - 1); }
            void entry(void) { once(3); }
            """)
        self.expect_no_bound("recursion: once -> again -> once")

    def test_a_function_that_calls_itself_is_no_bound(self):
        self.compile("void entry(int n) { WORK(20); if (n != 0) entry(n - 1); }")
        self.expect_no_bound("recursion: entry -> entry")

    def test_recursion_through_a_pointer_is_found(self):
        self.compile("""
            void entry(void);
            void (*volatile chosen)(void) = entry;
            void entry(void) { WORK(20); chosen(); }
            """)
        self.table["calls"] = [{"file": "src/program.c", "call": "chosen()", "targets": ["entry"]}]
        self.expect_no_bound("recursion: entry -> entry")

    POINTER = """
        static void small(void) { WORK(20); }
        static void large(void) { WORK(700); }
        void (*const choices[])(void) = {small, large};
        void entry(int n) { WORK(20); choices[n](); }
        """

    def test_the_table_tells_who_is_called_by_a_pointer(self):
        self.compile(self.POINTER)
        self.table["calls"] = [{"file": "src/program.c", "call": "choices[n]()", "targets": ["small", "large"]}]
        self.assertIn(f"| `entry` | {self.frame('entry') + self.frame('large')} | `large` |", self.run_tool().stdout)

    def test_a_call_by_a_pointer_of_which_the_table_says_nothing_is_no_bound(self):
        self.compile(self.POINTER)
        self.expect_no_bound("src/program.c:", "nobody says what this calls", "choices[n]()")

    def test_a_function_whose_address_is_taken_must_be_in_the_table(self):
        self.compile(self.POINTER)
        self.table["calls"] = [{"file": "src/program.c", "call": "choices[n]()", "targets": ["small"]}]
        self.expect_no_bound("the address of large is taken")

    def test_the_table_must_not_name_what_does_not_exist(self):
        self.compile(self.POINTER)
        self.table["calls"] = [{"file": "src/program.c", "call": "choices[n]()", "targets": ["small", "large", "gone"]}]
        self.expect_no_bound("the table names gone")

    def test_the_table_must_not_tell_of_calls_that_nobody_makes(self):
        self.compile("void entry(void) { WORK(20); }")
        self.table["calls"] = [{"file": "src/program.c", "call": "old_call()", "targets": ["entry"]}]
        self.expect_no_bound("no call by a pointer reads old_call()")

    def test_a_frame_without_a_fixed_size_is_no_bound(self):
        self.compile("""
            void vary(unsigned n) { char work[n + 1]; TEE_Use(work); }
            void entry(unsigned n) { WORK(20); vary(n); }
            """)
        self.expect_no_bound("the frame of vary has no fixed size")

    def test_memory_of_alloca_is_no_bound(self):
        self.compile("void entry(unsigned n) { TEE_Use(__builtin_alloca(n)); }")
        self.expect_no_bound("the frame of entry has no fixed size")

    def test_an_unknown_function_is_no_bound(self):
        self.compile("void elsewhere(void); void entry(void) { WORK(20); elsewhere(); }")
        self.expect_no_bound("nobody knows the stack of elsewhere, which entry calls")

    def test_an_entry_point_that_is_gone_is_no_bound(self):
        self.compile("void other(void) { WORK(20); }")
        self.expect_no_bound("entry: no such function")

    def test_an_object_without_its_graph_is_no_bound(self):
        self.compile("void entry(void) { WORK(20); }")
        self.compile("void other(void) { WORK(20); }", "other.c", graph=False)
        self.expect_no_bound("other.c.o has no call graph beside it")

    def test_each_command_goes_its_own_way(self):
        self.compile("""
            static void first(void) { WORK(100); }
            static void second(void) { WORK(800); }
            struct row { int id; const char *name; void (*handler)(void); };
            const struct row rows[] = {
            {1, "one", first},
            {2, "two", second},
            };
            void entry(int n) { WORK(20); rows[n].handler(); }
            """)
        self.table["commands"] = {"file": "src/program.c", "row": r'^ *\{(\d+), "(\w+)", (\w+)\},$',
                                  "call": "rows[n].handler(", "way": ["entry"]}
        answer = self.run_tool()
        self.assertEqual(answer.returncode, 0, answer.stdout + answer.stderr)
        self.assertIn(f"| `1 one` | {self.frame('entry') + self.frame('first')} | `first` |", answer.stdout)
        self.assertIn(f"| `2 two` | {self.frame('entry') + self.frame('second')} | `second` |", answer.stdout)
        self.assertIn("in `2 two`", answer.stdout)

    def test_a_command_table_that_is_not_recognised_is_no_bound(self):
        self.compile("void entry(void) { WORK(20); }")
        self.table["commands"] = {"file": "src/program.c", "row": r"^no such row (\d+)(\w+)(\w+)$", "call": "handler(",
                                  "way": ["entry"]}
        self.expect_no_bound("no row of the command table was recognised")


if __name__ == "__main__":
    TOOL, (COMPILER, OBJDUMP) = pathlib.Path(sys.argv[1]).resolve(), sys.argv[2:4]
    unittest.main(argv=sys.argv[:1], verbosity=2)
