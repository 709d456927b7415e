#!/usr/bin/env python3
"""Changes one condition, constant or call of the library at a time and counts what the tests notice.

All sources and headers of src/, posix/, platform/ and include/ are changed. Each mutant is compiled and linked into a
library of its own, which the test programs of the dev build (scripts/build.sh dev comes first) load instead of
theirs; a program that has a part of the mutant in itself is linked anew. The programs run as root in namespaces of
their own, where only /tmp can be written: a mutant may remove anything.

A file is tested by the programs of its name: X.cpp and X.h by X_test, X_*_test, fault_X_test and so on.

Results are kept in build/mutation/results.tsv by the text of the line: a stopped run goes on, and a changed line is
measured anew. The order is random but always the same, so that any part of a run is a fair sample.
"""

import argparse
import collections
import concurrent.futures
import json
import os
import pathlib
import random
import re
import shutil
import subprocess
import sys
import threading
import time

ROOT = pathlib.Path(__file__).resolve().parent.parent
BUILDS = pathlib.Path(os.environ.get("KELODR_BUILD_DIR", ROOT / "build"))
BUILD = BUILDS / "dev"
WORK = BUILDS / "mutation"
RESULTS = WORK / "results.tsv"
FOLDERS = ["src", "posix", "platform", "include/kelodrcore"]

# The names of further tests, for files of which no test, or not every one, has the name.
MORE_NAMES = {
    "descriptor": ["file", "file_lock", "json_value"],
    "directory_walk": ["file_lock"],
    "document_file": ["json_value", "json", "document", "file", "short_transfer"],
    "file": ["key_value", "short_transfer"],
    "file_io": ["file", "json_value", "platform"],
    "json_text": ["json_value", "locale", "response"],
    "json_value": ["json"],
    "kelocore": ["platform"],
    "kelocore_process": ["platform"],
    "kelorandom": ["platform", "utils"],
    "lock_fork": ["file_lock", "cache"],
    "log": ["file_lock", "sqlite_value"],
    "own_claim": ["cache"],
    "privilege": ["file", "cache"],
    "retry": ["file", "file_lock", "platform"],
    "sqlite_bulk": ["sqlite_transaction", "sqlite_db"],
    "sqlite_command": ["sqlite_select_command", "layout"],
    "sqlite_query": ["sqlite_db", "sqlite_transaction"],
    "sqlite_value": ["sqlite_db_row"],
    "trust": ["json_value", "cache"],
    "validator": ["utils"],
    "value_access": ["sqlite_value"],
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

Mutant = collections.namedtuple("Mutant", "file line start end new key")


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
        yield Mutant(path, line, start, end, new, re.sub(r" +", " ", f"{key}\t{seen[key]}"))


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


class Worker:
    """Builds and tests mutants in a directory of its own, on a mirror of the tree's sources."""

    def __init__(self, commands, number):
        self.dir = WORK / f"worker{number}"
        self.mirror = self.dir / "mirror"
        self.commands = commands
        self.linked = set()  # the test programs that are linked anew
        shutil.rmtree(self.dir, ignore_errors=True)
        for path in [*library_files(), *ROOT.glob("tests/*/*.cpp"), *ROOT.glob("tests/*/*.h")]:
            place = self.mirror / path.relative_to(ROOT)
            place.parent.mkdir(parents=True, exist_ok=True)
            place.symlink_to(path)

    def run_mutant(self, mutant, limits):
        text = mutant.file.read_text()
        source = self.mirror / mutant.file.relative_to(ROOT)
        source.unlink()
        source.write_text(text[:mutant.start] + mutant.new + text[mutant.end:])
        try:
            tests = sorted(tests_of(mutant.file), key=limits.get)
            if not self.build(mutant.file, tests):
                return "not compiled"
        finally:
            source.unlink()
            source.symlink_to(mutant.file)
        outcomes = (self.run_test(test, limits[test]) for test in tests)
        return next((outcome for outcome in outcomes if outcome != "passed"), "survived")

    def build(self, path, tests):
        """Compiles what the file is part of, and links the library and those programs anew."""
        library = self.commands.library
        changed = {library: self.commands.objects_of(library, path)}
        for test in tests:
            objects = self.commands.objects_of(f"tests/{test}", path)
            # The archives of posix/ and platform/ give a program only what is not among its objects.
            objects += [one for one in changed[library] if not one.startswith("src/")]
            if objects:
                changed[f"tests/{test}"] = objects
        self.linked = {pathlib.Path(output).name for output in changed}
        return (all(self.compile(one) for one in {one for all_ in changed.values() for one in all_})
                and all(self.link(output, objects) for output, objects in changed.items()))

    def object(self, name):
        return self.dir / name.replace("/", "_")

    def compile(self, name):
        command = re.sub(r" -(Werror|MD|g)\b| -M[TF] \S+", "", self.commands.compile[name])
        for folder in ["src", "posix", "platform", "include", "tests"]:
            command = command.replace(f"{ROOT}/{folder}", f"{self.mirror}/{folder}")
        command = command.replace(f"-I{ROOT} ", f"-I{self.mirror} ")
        return self.run(command.replace(f" -o {name}", f" -o {self.object(name)}") + " -w")

    def link(self, output, objects):
        command = self.commands.link[output]
        for name in objects:
            mutated = str(self.object(name))
            command = (command.replace(f" {name} ", f" {mutated} ") if f" {name} " in command
                       else command.replace(" -o ", f" {mutated} -o ", 1))
        name = "libkelodrcore.so.1" if output == self.commands.library else pathlib.Path(output).name
        return self.run(command.replace(f" -o {output}", f" -o {self.dir / name}"))

    @staticmethod
    def run(command):
        return subprocess.run(command, shell=True, cwd=BUILD, timeout=300,
                              capture_output=True).returncode == 0

    def run_test(self, name, limit):
        directory = self.dir if name in self.linked else BUILD / "tests"
        arguments = [KILL_FILTER] if name.startswith("kill_") else []
        command = SANDBOX + [str(directory / name), *arguments, "--gtest_brief=1", "--gtest_fail_fast"]
        process = subprocess.Popen(command, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
                                   stderr=subprocess.DEVNULL, start_new_session=True,
                                   env={**os.environ, "LD_LIBRARY_PATH": str(self.dir),
                                        "TEST_PREMATURE_EXIT_FILE": "/tmp/unfinished"})
        try:
            return "passed" if process.wait(limit) == 0 else "failed"
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()
            return "timed out"


def read_results():
    if not RESULTS.exists():
        return {}
    rows = (line.rsplit("\t", 1) for line in RESULTS.read_text().splitlines())
    return dict(rows)


def measured_limits(worker, programs):
    """How long each test program may take, from what it takes with the library as it is."""
    shutil.copy(BUILD / "src" / "libkelodrcore.so.1", worker.dir / "libkelodrcore.so.1")
    limits = {}
    for program in sorted(programs):
        begin = time.monotonic()
        if worker.run_test(program, 300) != "passed":
            sys.exit(f"mutate.py: {program} fails without any change")
        seconds = time.monotonic() - begin
        limits[program] = 10 + 5 * seconds
        print(f"mutate.py: {program} takes {seconds:.1f} s", flush=True)
    return limits


def run_all(mutants, minutes, jobs):
    commands = Commands()
    workers = [Worker(commands, number) for number in range(jobs)]
    limits = measured_limits(workers[0], {test for path in {m.file for m in mutants} for test in tests_of(path)})
    deadline = time.monotonic() + 60 * minutes
    lock = threading.Lock()

    def work(worker):
        while True:
            with lock:
                if not mutants or time.monotonic() > deadline:
                    return
                mutant = mutants.pop(0)
            outcome = worker.run_mutant(mutant, limits)
            with lock, RESULTS.open("a") as out:
                out.write(f"{mutant.key}\t{outcome}\n")

    with concurrent.futures.ThreadPoolExecutor(jobs) as pool:
        for future in [pool.submit(work, worker) for worker in workers]:
            future.result()


def report(mutants, results):
    print(f"\n{'file':24}{'mutants':>9}{'measured':>9}{'noticed':>9}{'survived':>9}{'share':>8}")
    total = collections.Counter()
    for path in sorted({mutant.file for mutant in mutants}):
        own = [mutant for mutant in mutants if mutant.file == path]
        counts = collections.Counter(results.get(mutant.key) for mutant in own)
        counts["mutants"] = len(own) - counts["not compiled"]
        print_row(path.name, counts)
        total += counts
    print_row("all", total)
    print("\nSurvivors:")
    for mutant in sorted(mutants, key=lambda m: (m.file, m.line)):
        if results.get(mutant.key) == "survived":
            print(f"{mutant.file.name}:{mutant.line}: {mutant.key.split(chr(9))[3]}"
                  f"    in: {mutant.key.split(chr(9))[1]}")


def print_row(name, counts):
    noticed = counts["failed"] + counts["timed out"]
    measured = noticed + counts["survived"]
    share = f"{100 * noticed / measured:.1f} %" if measured else "-"
    print(f"{name:24}{counts['mutants']:9}{measured:9}{noticed:9}{counts['survived']:9}{share:>8}")


def main():
    parser = argparse.ArgumentParser(description=__doc__,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--minutes", type=float, default=60, help="stop after that long (60)")
    parser.add_argument("--files", nargs="*", help="files of the library by their names, without .cpp and .h; all without")
    parser.add_argument("--jobs", type=int, default=2, help="how many at once (2)")
    parser.add_argument("--retry", action="store_true", help="measure again what survived or timed out")
    parser.add_argument("--report", action="store_true", help="only show what was measured")
    arguments = parser.parse_args()

    WORK.mkdir(parents=True, exist_ok=True)
    files = [path for path in library_files() if not arguments.files or path.stem in arguments.files]
    mutants = [mutant for path in files for mutant in mutants_of(path)]
    if not arguments.report:
        results = read_results()
        due = [m for m in mutants if m.key not in results or
               (arguments.retry and results[m.key] in ("survived", "timed out"))]
        random.Random(1).shuffle(due)
        run_all(due, arguments.minutes, arguments.jobs)
    report(mutants, read_results())


if __name__ == "__main__":
    main()
