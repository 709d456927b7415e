#!/usr/bin/env python3
"""Changes one condition, constant or call of the library at a time and counts what the tests notice.

All sources and headers of src/, posix/, platform/ and include/ are changed. Each mutant is compiled and linked into a
library of its own, which the test programs of the dev build (scripts/build.sh dev comes first) load instead of
theirs; a program that has a part of the mutant in itself is linked anew. The programs run as root in namespaces of
their own, where only /tmp can be written: a mutant may remove anything.

A file is tested by the programs of its name: X.cpp and X.h by X_test, X_*_test, fault_X_test and so on. A failure
counts when it comes twice in a row; so does a test that does not come to its end, if it does with the library as it is.

Results are kept in build/mutation/results.tsv by the text of the line: a stopped run goes on, and a changed line is
measured anew. The order is random but always the same, so that any part of a run is a fair sample.

--faults puts the faults of scripts/faults.py into the library instead, one at a time, and fails unless each is noticed.
Every run, a mere --report too, fails when the text that a fault replaces is not there any more.
"""

import argparse
import collections
import concurrent.futures
import json
import math
import os
import pathlib
import random
import re
import shutil
import subprocess
import sys
import tempfile
import threading
import time

sys.dont_write_bytecode = True  # nothing is left beside the scripts
import faults

ROOT = pathlib.Path(__file__).resolve().parent.parent
BUILDS = pathlib.Path(os.environ.get("KELODR_BUILD_DIR", ROOT / "build"))
BUILD = BUILDS / "dev"
WORK = BUILDS / "mutation"
RESULTS = WORK / "results.tsv"
SYSTEM = WORK / "system.h"
TIMES = WORK / "times.json"  # of the test programs as they were built
FOLDERS = ["src", "posix", "platform", "include/kelodrcore"]

# The names of further tests, for files of which no test, or not every one, has the name.
MORE_NAMES = {
    "access": ["json_value", "json", "document", "document_file"],
    "cache": ["log_crowd"],
    "descriptor": ["file", "file_lock", "json_value"],
    "directory_walk": ["file_lock", "lock", "cache_process"],
    "document_file": ["json_value", "json", "document", "cache_update", "file", "short_transfer"],
    "file": ["key_value", "short_transfer"],
    "file_io": ["file", "json_value", "platform", "document", "cache_process"],
    "file_lock": ["lock", "cache"],
    "json_text": ["json", "json_value", "locale", "response"],
    "json_value": ["json"],
    "kelocore": ["platform", "cache_process"],
    "kelocore_process": ["platform"],
    "kelorandom": ["platform", "utils"],
    "lock_fork": ["file_lock", "cache"],
    "log": ["file_lock", "sqlite_value"],
    "own_claim": ["cache"],
    "pipe": ["platform", "utils", "cache_process"],
    "privilege": ["file", "cache"],
    "retry": ["file", "file_lock", "platform", "signal_storm"],
    "sqlite_attempt": ["sqlite_bulk", "sqlite_transaction", "sqlite_db", "transaction"],
    "sqlite_bulk": ["sqlite_transaction", "sqlite_db"],
    "sqlite_command": ["sqlite_select_command", "layout"],
    "sqlite_query": ["sqlite_db", "sqlite_transaction"],
    "sqlite_transaction": ["transaction"],
    "sqlite_value": ["sqlite_db_row"],
    "trust": ["json_value", "cache", "document"],
    "validator": ["utils"],
    "value_access": ["sqlite_value", "sqlite_db_row"],
}
# Sweeps of kills take minutes; the other tests of those programs do not.
KILL_FILTER = "--gtest_filter=-*Killed*"

# The formatter puts blanks around binary operators and none around template brackets.
# The call of a statement is removed as a whole; a string gets a byte more in front.
SWAPS = {" == ": [" != "], " != ": [" == "], " < ": [" <= ", " >= "], " <= ": [" < ", " > "],
         " > ": [" >= ", " <= "], " >= ": [" > ", " < "], " && ": [" || "], " || ": [" && "],
         " + ": [" - "], " - ": [" + "], "++": ["--"], "--": ["++"], " += ": [" -= "],
         " -= ": [" += "]}
OPERATOR = re.compile("|".join(re.escape(op) for op in sorted(SWAPS, key=len, reverse=True)))
NUMBER = re.compile(r"(?<![\w.])(0x[0-9a-fA-F]+|\d+)[uUlL]*(?![\w.])")
BOOLEAN = re.compile(r"\b(true|false)\b")
CONDITION = re.compile(r"\b(?:if|while) \(")
CALL = re.compile(r"^ +(?:(?:\(void\))?[\w:.>-]+\(.*\));$", re.M)
STRING = re.compile(r'"(?:[^"\\\n]|\\.)*"')
OBJECT = re.compile(r"\S+\.o(?= )")
# Every mount of the file system read-only but /tmp; a shell is process 1 there and takes orphans. A
# program that ends before its last test, with whatever status, leaves the file.
SANDBOX = ["unshare", "--mount", "--pid", "--fork", "--kill-child", "--mount-proc", "bash", "-c",
           'mount -t tmpfs tmpfs /tmp && mount -o remount,bind,ro / && '
           '"$@" && [ ! -e $TEST_PREMATURE_EXIT_FILE ]; exit $?', "bash"]

NOTICED = ["failed", "timed out"]
LINKER = "-fuse-ld=lld" if shutil.which("ld.lld") else ""

# The edits are (start, end, new text), from the last one of the file to the first.
Mutant = collections.namedtuple("Mutant", "file line edits key")


def blanked(text):
    """The text without comments and preprocessor lines, and the same without strings; blanks
    stand in their place, so that every offset stays."""
    blank = lambda match: re.sub(r"[^\n]", " ", match.group())
    token = re.compile(r'//[^\n]*|^#[^\n]*|"(?:[^"\\\n]|\\.)*"|\'(?:[^\'\\]|\\.)\'', re.M)
    code = token.sub(lambda m: m.group() if m.group()[0] in "\"'" else blank(m), text)
    return code, token.sub(blank, text)


def closing(code, start):
    """The offset of the bracket that closes the one before `start`."""
    depth = 1
    for offset in range(start, len(code)):
        depth += {"(": 1, ")": -1}.get(code[offset], 0)
        if depth == 0:
            return offset
    return None


def one_more(number):
    if len(number) > 1 and number.startswith("0") and "x" not in number:
        return f"0{int(number, 8) + 1:o}"
    return str(int(number, 0) + 1)


def changes(text):
    """Yields (start, end, replacement)."""
    code, bare = blanked(text)
    for match in OPERATOR.finditer(bare):
        for new in SWAPS[match.group()]:
            yield match.start(), match.end(), new
    for match in NUMBER.finditer(bare):
        yield match.start(1), match.end(1), one_more(match.group(1))
    for match in BOOLEAN.finditer(bare):
        yield match.start(), match.end(), "false" if match.group() == "true" else "true"
    for match in CONDITION.finditer(bare):
        end = closing(bare, match.end())
        if end and ";" not in bare[match.end():end]:
            yield match.end(), end, "!(" + text[match.end():end] + ")"
    for match in CALL.finditer(bare):
        yield match.start(), match.end(), ";"
    for match in STRING.finditer(code):
        yield match.start(), match.start() + 1, '"~'


def mutants_of(path):
    text = path.read_text()
    lines = text.split("\n")
    seen = collections.Counter()
    for start, end, new in changes(text):
        line = text.count("\n", 0, start) + 1
        column = start - (text.rfind("\n", 0, start) + 1)
        old = text[start:end].replace("\n", " ")
        shown = " ".join(new.split()) if new.startswith("!(") else new.strip()
        key = f"{path.relative_to(ROOT)}\t{lines[line - 1].strip()}\t{column}\t{old.strip()} => {shown}"
        seen[key] += 1
        yield Mutant(path, line, [(start, end, new)], re.sub(r" +", " ", f"{key}\t{seen[key]}"))


def fault_of(name, file, replacements):
    """The mutant of a fault made by hand; each old text stands in the file once."""
    path = ROOT / file
    text = path.read_text()
    for old, _ in replacements:
        if text.count(old) != 1:
            sys.exit(f"mutate.py: {name}: {file} does not have this once:\n{old}")
    edits = sorted(((text.index(old), text.index(old) + len(old), new) for old, new in replacements), reverse=True)
    return Mutant(path, text.count("\n", 0, edits[-1][0]) + 1, edits, name)


def library_files():
    return [path for folder in FOLDERS for path in sorted((ROOT / folder).iterdir())
            if path.suffix in (".cpp", ".h")]


def tests_of(path):
    """The test programs of a file of the library."""
    stems = {file.stem for file in library_files()}
    programs = []
    for source in sorted(ROOT.glob("tests/*/*_test.cpp")):
        tested = re.sub(r"^(fault|intercepted|kill)_", "", source.stem) + "_"
        owner = max((stem for stem in stems if tested.startswith(stem + "_")), key=len, default="")
        names = [path.stem] + MORE_NAMES.get(path.stem, [])
        if source.parent.name != "support" and any(
                tested.startswith(name + "_") and len(owner) <= len(name) for name in names):
            programs.append(source.stem)
    return programs or sys.exit(f"mutate.py: {path.name} has no tests; MORE_NAMES can name them")


class Commands:
    """The commands of the dev build, and the files that each object is compiled from."""

    def __init__(self):
        self.compile, self.link, self.files = {}, {}, {}
        for entry in json.loads(self.ninja("compdb")):
            output, command = entry["output"], re.sub(r" && cd .*", "", entry["command"])
            if output.endswith(".o") and entry["file"].endswith(".cpp"):
                self.compile[output] = command
            elif re.fullmatch(r"src/libkelodrcore\.so\.\d+\.[\d.]+|tests/\w+_test", output) and command:
                self.link[output] = command
        for part in self.ninja("deps").split("\n\n"):
            head, *files = part.split("\n")
            self.files[head.split(":")[0]] = {os.path.normpath(BUILD / file.strip()) for file in files}
        self.library = next(output for output in self.link if output.startswith("src/"))

    @staticmethod
    def ninja(tool):
        return subprocess.run(["ninja", "-C", str(BUILD), "-t", tool], check=True,
                              capture_output=True, text=True).stdout

    def objects_of(self, output, path):
        """The objects of a library or program that the file is part of."""
        objects = OBJECT.findall(self.link[output])
        return [one for one in objects if str(path) in self.files.get(one, ())]


class Tests:
    """What is known of the test programs: how long each takes, and for which files each failed."""

    def __init__(self, worker, programs, longest):
        self.seconds, self.failures = {}, collections.Counter()
        self.longest = longest
        known = json.loads(TIMES.read_text()) if TIMES.exists() else {}
        for program in sorted(programs):
            built = (BUILD / "tests" / program).stat().st_mtime
            if known.get(program, [0])[0] != built:
                known[program] = [built, self.measured(worker, program)]
                TIMES.write_text(json.dumps(known, indent=1))
            self.seconds[program] = known[program][1]

    @staticmethod
    def measured(worker, program):
        begin = time.monotonic()
        if worker.run_test(program, 900, BUILD) != "passed":
            sys.exit(f"mutate.py: {program} fails without any change")
        seconds = time.monotonic() - begin
        print(f"mutate.py: {program} takes {seconds:.1f} s", flush=True)
        return seconds

    def in_order(self, path):
        """First those that are quick and failed often for this file."""
        return sorted((test for test in tests_of(path) if self.seconds[test] <= self.longest),
                      key=lambda test: self.seconds[test] / (1 + self.failures[path, test]))

    def limit(self, test):
        return 10 + 5 * self.seconds[test]


class Worker:
    """Builds and tests mutants in a directory of its own, on a mirror of the tree's sources."""

    def __init__(self, commands):
        self.place = tempfile.TemporaryDirectory(prefix="worker", dir=WORK)
        self.dir = pathlib.Path(self.place.name)
        self.mirror = self.dir / "mirror"
        self.commands = commands
        self.compiled, self.linked = set(), set()  # of the mutant at hand: objects, test programs
        for path in [*library_files(), *ROOT.glob("tests/*/*.cpp"), *ROOT.glob("tests/*/*.h")]:
            place = self.mirror / path.relative_to(ROOT)
            place.parent.mkdir(parents=True, exist_ok=True)
            place.symlink_to(path)

    def compile_system_headers(self):
        """Compiles what src/ includes of the system, once for all runs: it takes most of the time of a compilation."""
        texts = [path.read_text() for path in library_files()]
        includes = sorted({line for text in texts for line in re.findall(r"^#include <.+>$", text, re.M)})
        first = next(one for one in self.commands.compile if one.startswith("src/"))
        command = re.sub(r" -o \S+ -c \S+", f" -x c++-header {SYSTEM} -o {SYSTEM}.gch", self.compilation(first))
        text = "\n".join(includes) + f"\n// {command.replace(str(self.dir), '')}\n"
        if not SYSTEM.exists() or SYSTEM.read_text() != text:
            SYSTEM.write_text(text)
            self.run(command)

    def run_mutant(self, mutant, tests):
        """Returns the outcome and the test that gave it."""
        text = mutant.file.read_text()
        for start, end, new in mutant.edits:
            text = text[:start] + new + text[end:]
        source = self.mirror / mutant.file.relative_to(ROOT)
        source.unlink()
        source.write_text(text)
        try:
            return self.run_tests(mutant, tests)
        finally:
            source.unlink()
            source.symlink_to(mutant.file)

    def run_tests(self, mutant, tests):
        self.compiled, self.linked = set(), set()
        if not self.build(self.commands.library, mutant.file):
            return "not compiled"
        for program in tests.in_order(mutant.file):
            if not self.build(f"tests/{program}", mutant.file):
                return "not compiled"
            outcome = self.run_test(program, tests.limit(program))
            if outcome == "passed":
                continue
            if not self.is_noticed(program, outcome, tests.limit(program)):
                print(f"mutate.py: {program} {outcome} by chance: {mutant.key}", flush=True)
                continue
            tests.failures[mutant.file, program] += 1
            return f"{outcome} in {program}"
        return "survived"

    def is_noticed(self, program, outcome, limit):
        """Whether an outcome comes again, and is not the machine's, which may be too busy."""
        return ((outcome == "failed" or self.run_test(program, limit, BUILD) == "passed")
                and self.run_test(program, limit) == outcome)

    def build(self, output, path):
        """Compiles what the file is part of, and links the library, or a program that has a part, anew."""
        library = self.commands.library
        objects = self.commands.objects_of(output, path)
        if output != library:
            # The archives of posix/ and platform/ give a program only what is not among its objects.
            objects += [one for one in self.commands.objects_of(library, path) if not one.startswith("src/")]
            if not objects:
                return True
            self.linked.add(pathlib.Path(output).name)
        return all(self.compile(one) for one in objects) and self.link(output, objects)

    def compile(self, name):
        if name in self.compiled:
            return True
        self.compiled.add(name)
        return self.run(self.compilation(name))

    def object(self, name):
        return self.dir / name.replace("/", "_")

    def compilation(self, name):
        command = re.sub(r"^ccache | -(Werror|MD|g)\b| -M[TF] \S+", "", self.commands.compile[name])
        for folder in ["src", "posix", "platform", "include", "tests"]:
            command = command.replace(f"{ROOT}/{folder}", f"{self.mirror}/{folder}")
        command = command.replace(f"-I{ROOT} ", f"-I{self.mirror} ")
        if name.startswith("src/"):
            command += f" -include {SYSTEM}"
        return command.replace(f" -o {name}", f" -o {self.object(name)}") + " -w"

    def link(self, output, objects):
        command = self.commands.link[output]
        for name in objects:
            mutated = str(self.object(name))
            command = (command.replace(f" {name} ", f" {mutated} ") if f" {name} " in command
                       else command.replace(" -o ", f" {mutated} -o ", 1))
        name = "libkelodrcore.so.1" if output == self.commands.library else pathlib.Path(output).name
        command = command.replace(f" -o {output}", f" {LINKER} -o {self.dir / name}")
        return self.run(command)

    @staticmethod
    def run(command):
        return subprocess.run(command, shell=True, cwd=BUILD, timeout=600,
                              capture_output=True).returncode == 0

    def run_test(self, name, limit, build=None):
        """Runs a program with the library of the mutant, or with that of `build`."""
        directory = self.dir if name in self.linked and not build else BUILD / "tests"
        arguments = [KILL_FILTER] if name.startswith("kill_") else []
        command = SANDBOX + [str(directory / name), *arguments, "--gtest_brief=1", "--gtest_fail_fast"]
        process = subprocess.Popen(command, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
                                   stderr=subprocess.DEVNULL, start_new_session=True,
                                   env={**os.environ, "LD_LIBRARY_PATH": str(build / "src" if build else self.dir),
                                        "TEST_PREMATURE_EXIT_FILE": "/tmp/unfinished"})
        try:
            return "passed" if process.wait(limit) == 0 else "failed"
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()
            return "timed out"


def read_results():
    """The outcomes by the keys of the mutants."""
    if not RESULTS.exists():
        return {}
    return dict(line.rsplit("\t", 1) for line in RESULTS.read_text().splitlines())


def word_of(outcome):
    """An outcome without the name of the test."""
    return outcome.split(" in ")[0]


def keep(mutant, outcome):
    with RESULTS.open("a") as out:
        out.write(f"{mutant.key}\t{outcome}\n")


def run_all(mutants, arguments, take):
    """Measures the mutants and gives each with its outcome to `take`."""
    WORK.mkdir(parents=True, exist_ok=True)
    commands = Commands()
    workers = [Worker(commands) for _ in range(arguments.jobs)]
    workers[0].compile_system_headers()
    programs = {test for path in {m.file for m in mutants} for test in tests_of(path)}
    tests = Tests(workers[0], programs, arguments.longest)
    due = iter(mutants)
    deadline = time.monotonic() + 60 * arguments.minutes
    lock = threading.Lock()

    def work(worker):
        while time.monotonic() < deadline:
            with lock:
                mutant = next(due, None)
            if mutant is None:
                return
            outcome = worker.run_mutant(mutant, tests)
            with lock:
                take(mutant, outcome)

    with concurrent.futures.ThreadPoolExecutor(arguments.jobs) as pool:
        for future in [pool.submit(work, worker) for worker in workers]:
            future.result()


def run_faults(due, arguments):
    """Whether each fault is noticed."""
    outcomes = {}

    def take(fault, outcome):
        outcomes[fault.key] = outcome
        print(f"{outcome:45} {fault.key}", flush=True)

    run_all(due, arguments, take)
    noticed = sum(word_of(outcome) in NOTICED for outcome in outcomes.values())
    print(f"{noticed} of {len(due)} faults are noticed")
    return noticed == len(due)


def report(mutants, results):
    print(f"\n{'file':24}{'mutants':>9}{'measured':>9}{'noticed':>9}{'survived':>9}{'share':>8}")
    total = collections.Counter()
    for path in sorted({mutant.file for mutant in mutants}):
        own = [mutant for mutant in mutants if mutant.file == path]
        counts = collections.Counter(word_of(results.get(mutant.key, "")) for mutant in own)
        counts["mutants"] = len(own) - counts["not compiled"]
        print_row(path.name, counts)
        total += counts
    print_row("all", total)
    print(f"{total['timed out']} of them were noticed because a test did not come to its end.\n\nSurvivors:")
    for mutant in sorted(mutants, key=lambda m: (m.file, m.line)):
        if results.get(mutant.key) == "survived":
            print(f"{mutant.file.name}:{mutant.line}: {mutant.key.split(chr(9))[3]}"
                  f"    in: {mutant.key.split(chr(9))[1]}")


def print_row(name, counts):
    noticed = sum(counts[outcome] for outcome in NOTICED)
    measured = noticed + counts["survived"]
    share = f"{100 * noticed / measured:.1f} %" if measured else "-"
    print(f"{name:24}{counts['mutants']:9}{measured:9}{noticed:9}{counts['survived']:9}{share:>8}")


def main():
    parser = argparse.ArgumentParser(description=__doc__,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--minutes", type=float, default=60, help="stop after that long (60)")
    parser.add_argument("--files", nargs="*", help="files of the library by their names, without .cpp and .h; all without")
    parser.add_argument("--jobs", type=int, default=2, help="how many at once (2)")
    parser.add_argument("--longest", type=float, default=math.inf,
                        help="leave out test programs that take more seconds; --retry gives survivors to them, too")
    parser.add_argument("--retry", action="store_true", help="measure again what survived or timed out")
    parser.add_argument("--faults", action="store_true", help="measure the faults made by hand")
    parser.add_argument("--report", action="store_true", help="only show what was measured")
    arguments = parser.parse_args()

    files = [path for path in library_files() if not arguments.files or path.stem in arguments.files]
    made_by_hand = [fault_of(*fault) for fault in faults.FAULTS]
    if arguments.faults:
        sys.exit(not run_faults([fault for fault in made_by_hand if fault.file in files], arguments))
    mutants = [mutant for path in files for mutant in mutants_of(path)]
    if not arguments.report:
        results = read_results()
        due = [m for m in mutants if m.key not in results or
               (arguments.retry and word_of(results[m.key]) in ("survived", "timed out"))]
        random.Random(1).shuffle(due)
        due.sort(key=lambda mutant: mutant.key not in results)  # what is measured again comes first
        run_all(due, arguments, keep)
    report(mutants, read_results())


if __name__ == "__main__":
    main()
