#!/usr/bin/env python3
"""Changes one condition, constant or call of src/ at a time and counts what the tests notice.

Each mutant of a source file is compiled and linked into a library of its own, which the test
programs of the dev build (cmake --build --preset dev comes first) load instead of theirs. They run
as root in namespaces of their own, where only /tmp can be written: a mutant may remove anything.

Results are kept in build/mutation/results.tsv by the text of the line: a stopped run goes on, and a
changed line is measured anew. The order is random but always the same, so that any part of a run
is a fair sample.
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
BUILD = ROOT / "build" / "dev"
WORK = ROOT / "build" / "mutation"
RESULTS = WORK / "results.tsv"

# The test programs of each source file, the quickest first; the first that fails ends a mutant.
TESTS = {
    "cache": ["cache_test", "intercepted_cache_test", "cache_process_test", "fault_cache_test"],
    "container": ["container_test"],
    "document_file": ["intercepted_document_test", "json_value_test", "fault_json_test",
                      "kill_file_test --gtest_filter=PowerLoss*:*ReachesTheDisk*"],
    "err": ["err_test"],
    "file": ["file_test", "key_value_test", "intercepted_file_test", "fault_file_test"],
    "file_lock": ["file_lock_test", "fault_file_lock_test"],
    "json_text": ["json_value_test", "intercepted_locale_test", "response_test"],
    "json_value": ["json_value_test", "fault_json_test"],
    "privilege": ["privilege_test", "file_test", "cache_test"],
    "request": ["request_test"],
    "response": ["response_test"],
    "sqlite_command": ["sqlite_command_test", "sqlite_select_command_test", "layout_test"],
    "sqlite_condition": ["sqlite_condition_test"],
    "sqlite_db": ["sqlite_db_test", "sqlite_db_row_test", "sqlite_db_table_test",
                  "sqlite_db_retry_test", "sqlite_db_process_test", "sqlite_db_memory_test",
                  "fault_sqlite_db_test"],
    "sqlite_table_handler": ["sqlite_table_handler_test"],
    "sqlite_value": ["sqlite_value_list_test", "sqlite_db_row_test", "sqlite_value_test"],
    "utils": ["utils_test", "fault_utils_test"],
    "validator": ["utils_test"],
}

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
# The object of a source file that a test program has a copy of.
COPY = re.compile(r"tests/CMakeFiles/\S+/__/src/(\w+)\.cpp\.o")
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
        key = f"{path.stem}\t{lines[line - 1].strip()}\t{column}\t{old.strip()} => {shown}"
        seen[key] += 1
        yield Mutant(path, line, start, end, new, re.sub(r" +", " ", f"{key}\t{seen[key]}"))


class Worker:
    """Builds and tests mutants in a directory of its own."""

    def __init__(self, commands, number):
        self.dir = WORK / f"worker{number}"
        self.dir.mkdir(parents=True, exist_ok=True)
        self.commands = commands
        self.linked = set()  # the test programs with a copy of what the mutant changes

    def run_mutant(self, mutant, limits):
        text = mutant.file.read_text()
        source = self.dir / mutant.file.name
        source.write_text(text[:mutant.start] + mutant.new + text[mutant.end:])
        if not self.build(mutant.file, source):
            return "not compiled"
        for test in TESTS[mutant.file.stem]:
            outcome = self.run_test(test, limits[test])
            if outcome != "passed":
                return outcome
        return "survived"

    def build(self, original, source):
        compiler, link, copies = self.commands
        named, compile_command = compiler[original]
        compile_command = compile_command.replace(named, str(source))
        target = re.search(r" -o (\S+)", compile_command).group(1)
        mutated = self.dir / "mutant.o"
        compile_command = compile_command.replace(f" -o {target}", f" -o {mutated}")
        compile_command = re.sub(r" -(Werror|MD|g)\b| -M[TF] \S+", "", compile_command)
        library = self.dir / "libkelodrcore.so.1"
        link_command = re.sub(r" -o \S+", f" -o {library}", link.replace(target, str(mutated)))
        commands = [f"{compile_command} -w -I{ROOT}/src", link_command]
        self.linked = set()
        for program, copy, command in copies[original.stem]:
            name = pathlib.Path(program).name
            command = command.replace(copy, str(mutated))
            commands.append(command.replace(f" -o {program}", f" -o {self.dir / name}"))
            self.linked.add(name)
        run = lambda command: subprocess.run(command, shell=True, cwd=BUILD, timeout=300,
                                             capture_output=True).returncode == 0
        return all(run(command) for command in commands)

    def run_test(self, test, limit):
        name, *arguments = test.split()
        directory = self.dir if name in self.linked else BUILD / "tests"
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


def build_commands():
    database = subprocess.run(["ninja", "-C", str(BUILD), "-t", "compdb"], check=True,
                              capture_output=True, text=True).stdout
    compiler, link, copies = {}, None, collections.defaultdict(list)
    for entry in json.loads(database):
        path = pathlib.Path(entry["directory"], entry["file"])
        copy = COPY.search(entry["command"])
        if copy and path.suffix != ".cpp":
            command = re.sub(r" && cd .*", "", entry["command"])  # without looking for its tests
            copies[copy.group(1)].append((entry["output"], copy.group(), command))
        if "/kelodrcore.dir/" in entry["output"] and path.suffix == ".cpp":
            compiler[path.resolve()] = entry["file"], entry["command"]
        if re.fullmatch(r"src/libkelodrcore\.so\.\d+\.[\d.]+", entry["output"]):
            link = entry["command"]
    return compiler, link, copies


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
    commands = build_commands()
    workers = [Worker(commands, number) for number in range(jobs)]
    limits = measured_limits(workers[0], {p for m in mutants for p in TESTS[m.file.stem]})
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
    parser.add_argument("--files", nargs="*", help="file names of src/ without .cpp; all without")
    parser.add_argument("--jobs", type=int, default=2, help="how many at once (2)")
    parser.add_argument("--retry", action="store_true", help="measure again what survived or timed out")
    parser.add_argument("--report", action="store_true", help="only show what was measured")
    arguments = parser.parse_args()

    WORK.mkdir(parents=True, exist_ok=True)
    files = [ROOT / "src" / f"{name}.cpp" for name in arguments.files or TESTS]
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
