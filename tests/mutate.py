#!/usr/bin/env python3
"""Seeds faults that a maintainer could make into the sources, one at a time, and tells which of them no test
notices. Works in a copy of the work tree, build/mutate/tree, and goes on where it was stopped.

A fault that does not compile, or after which the libraries, plug-ins and programs are the same, is none. The
tests that reach the line are run, the quickest first; all of them for a line that is read by the compiler alone, as
those of tables are. All results are kept in
build/mutate/results.jsonl, without which it begins anew; --again seeds anew what has survived."""

import argparse
import collections
import hashlib
import json
import os
import pathlib
import random
import re
import shutil
import subprocess
import sys
import time
import xml.etree.ElementTree as xml

ROOT = pathlib.Path(__file__).resolve().parent.parent
WORK = ROOT / "build/mutate"
TREE = WORK / "tree"
RESULTS = WORK / "results.jsonl"
SOURCES = ("api", "channel", "core", "include", "plugins", "properties", "streams", "tools", "util")


# --- The faults ---

SWAPS = [("<", "<="), ("<=", "<"), (">", ">="), (">=", ">"), ("==", "!="), ("!=", "=="), ("&&", "||"),
         ("||", "&&"), ("+", "-"), ("-", "+"), ("+=", "-="), ("-=", "+=")]
STATEMENT = re.compile(r"^(\s+)(?!return\b|throw\b|delete\b|using\b|case\b|break\b)[\w:.>\[\]*-]+(\(.*\)| [-+|&]?= .*);$")
LOCK = re.compile(r"^\s+(const )?std::(lock_guard|scoped_lock|unique_lock)\b.*;$|^\s+\w*\.notify_(one|all)\(\);$")


def texts_and_code(line):
    """Where the texts of a line are, and the line with blanks in place of them and of its comment."""
    texts = [m.span(1) for m in re.finditer(r'"((?:[^"\\]|\\.)*)"', line) if m[1]]
    code = re.sub(r'"(?:[^"\\]|\\.)*"|\'(?:[^\'\\]|\\.)\'', lambda m: '"' + " " * (len(m[0]) - 2) + '"', line)
    comment = code.find("//")
    return texts, code if comment < 0 else code[:comment] + " " * (len(code) - comment)


def faults_of_line(line, following):
    texts, code = texts_and_code(line)
    stripped = code.strip()
    if not stripped or stripped.startswith(("#", "*", "/*", "static_assert", "template", "using", "namespace")):
        return
    if found := re.match(r"(\s*(?:\} else )?(?:if|while) \()(.*)(\) \{)$", code.rstrip()):
        if ";" not in found[2]:
            start, end = found.span(2)
            yield "negated", line[:start] + "!(" + line[start:end] + ")" + line[end:]
    for found in re.finditer(r"(?<= )(<=?|>=?|==|!=|&&|\|\||\+=?|-=?)(?= )", code):
        yield "operator", line[:found.start()] + dict(SWAPS)[found[1]] + line[found.end():]
    for found in re.finditer(r"(?<![\w.#\"])(\d+)(?![\w.'])", code):
        yield "constant", line[:found.start()] + str(int(found[1]) + 1) + line[found.end():]
    for found in re.finditer(r"\b(true|false)\b", code):
        yield "constant", line[:found.start()] + ("false" if found[1] == "true" else "true") + line[found.end():]
    for start, end in texts:
        if not stripped.startswith(("extern", "R\"")):
            yield "text", line[:end] + "~" + line[end:]
    if LOCK.match(code):
        yield "lock", ""
    elif STATEMENT.match(code):
        yield "dropped", ""
        if STATEMENT.match(texts_and_code(following)[1]) and following[:len(line) - len(line.lstrip())].isspace():
            yield "swapped", following + "\n" + line


def faults_of(name):
    """All faults of a file: (line, kind, new text of the line, or of two of them if they are swapped)."""
    text = (ROOT / name).read_text()
    raw = re.sub(r'R"(\w*)\((.*?)\)\1"|/\*.*?\*/', lambda m: re.sub(r"[^\n]", " ", m[0]), text, flags=re.S)
    lines = raw.splitlines()
    places = collections.Counter()
    for number, line in enumerate(lines):
        if line == text.splitlines()[number]:
            for kind, changed in faults_of_line(line, lines[number + 1] if number + 1 < len(lines) else ""):
                if changed.strip() != line.strip():
                    key = f"{name}:{line.strip()}:{kind}:{changed.strip()}"
                    places[key] += 1
                    key += f":{places[key]}"
                    yield {"id": hashlib.sha1(key.encode()).hexdigest()[:12], "file": name, "line": number + 1,
                           "kind": kind, "was": line.strip(), "is": changed.strip(), "text": changed}


# --- The copy, its builds and its tests ---

def run(command, **options):
    return subprocess.run(command, cwd=TREE, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True,
                          errors="replace", check=False, **options)


def must(command, **options):
    done = run(command, **options)
    if done.returncode != 0:
        sys.exit(f"{' '.join(map(str, command))} failed:\n{done.stdout[-4000:]}")
    return done.stdout


def copy_tree():
    """Brings the copy up to date. Returns a digest of all that is in it."""
    listed = subprocess.run(["git", "ls-files", "--cached", "--others", "--exclude-standard"], cwd=ROOT,
                            capture_output=True, text=True, check=True).stdout.split("\n")
    digest = hashlib.sha1()
    for name in filter(None, listed):
        source, target = ROOT / name, TREE / name
        if not source.is_file():
            continue
        content = source.read_bytes()
        digest.update(name.encode() + content)
        if not target.is_file() or target.read_bytes() != content:
            target.parent.mkdir(parents=True, exist_ok=True)
            shutil.copyfile(source, target)
            shutil.copymode(source, target)
    return digest.hexdigest()


def configure(build, *more):
    must(["cmake", "-S", ".", "-B", build, "-G", "Ninja", *more])


def products():
    """A digest of each thing that is built for the user."""
    files = [path for folder in ("bin", "lib") for path in (TREE / "build/release" / folder).rglob("*")
             if path.is_file() and not path.is_symlink() and "test" not in path.name and "fuzz" not in path.name]
    if not files:
        sys.exit("nothing was built")
    return {path: hashlib.sha1(path.read_bytes()).hexdigest() for path in files}


def run_tests(names, limit):
    """Runs these tests until one fails. Returns its name, or None."""
    pattern = "^(" + "|".join(map(re.escape, names)) + ")$"
    done = run(["ctest", "--test-dir", "build/release", "-R", pattern, "--stop-on-failure", "--timeout", str(limit)])
    failed = re.findall(r"^\s+\d+ - (\S+) \(", done.stdout, flags=re.M)
    if done.returncode != 0 and not failed:
        sys.exit(f"ctest failed:\n{done.stdout[-4000:]}")
    return failed[0] if failed else None


def reached_lines(tests):
    """The tests that reach a line, by "file:line"."""
    build = TREE / "build/reach"
    flags = "-O0 --coverage"
    configure(build, "-DCMAKE_BUILD_TYPE=Debug", f"-DCMAKE_C_FLAGS={flags}", f"-DCMAKE_CXX_FLAGS={flags}")
    must(["cmake", "--build", build])
    reach = collections.defaultdict(list)
    for number, test in enumerate(tests):
        print(f"\rwhat the tests reach: {number + 1} of {len(tests)}", end="", file=sys.stderr, flush=True)
        for data in build.rglob("*.gcda"):
            data.unlink()
        run(["ctest", "--test-dir", build, "-R", f"^{re.escape(test)}$", "--timeout", "300"])
        data = [str(path) for path in build.rglob("*.gcda")]
        seen = set()
        for line in (run(["gcov", "--json-format", "--stdout", *data]).stdout if data else "").splitlines():
            for file in json.loads(line)["files"] if line.startswith("{") else []:
                name = os.path.relpath(os.path.join(TREE, file["file"]), TREE)
                if name.startswith(SOURCES):
                    seen.update(f"{name}:{at['line_number']}" for at in file["lines"] if at["count"] > 0)
        for place in seen:
            reach[place].append(test)
    print(file=sys.stderr)
    if not reach:
        sys.exit(f"the tests reach no line, as gcov has it: remove {build} and try again")
    return reach


def prepare():
    """Builds the copy and learns about its tests. Returns their seconds and what reaches each line."""
    TREE.mkdir(parents=True, exist_ok=True)
    digest = copy_tree()
    # Not for what the tests reach: what a cached object reaches is counted where it was first compiled.
    launchers = [f"-DCMAKE_{language}_COMPILER_LAUNCHER=ccache" for language in ("C", "CXX") if shutil.which("ccache")]
    configure("build/release", "-DCMAKE_BUILD_TYPE=Release", *launchers)
    must(["cmake", "--build", "build/release"])
    known = WORK / "tests.json"
    if known.exists() and (facts := json.loads(known.read_text()))["digest"] == digest:
        return facts["seconds"], facts["reach"]
    must(["ctest", "--test-dir", "build/release", "--output-junit", WORK / "junit.xml"])
    seconds = {case.get("name"): float(case.get("time")) for case in xml.parse(WORK / "junit.xml").iter("testcase")}
    reach = reached_lines(list(seconds))
    known.write_text(json.dumps({"digest": digest, "seconds": seconds, "reach": reach}))
    return seconds, reach


def seed(fault, seconds, reach, sound):
    """Returns what became of a fault: the test that noticed it, or why none did."""
    target = TREE / fault["file"]
    original = target.read_text()
    lines = original.split("\n")
    lines[fault["line"] - 1:fault["line"] + (fault["kind"] == "swapped")] = fault["text"].split("\n")
    try:
        target.write_text("\n".join(lines))
        if run(["cmake", "--build", "build/release"]).returncode != 0:
            return "does not compile"
        if products() == sound:
            return "changes nothing"
        quickest = sorted(seconds, key=seconds.get)
        reaching = reach.get(f"{fault['file']}:{fault['line']}", quickest) # all of a table that the compiler reads
        rows = [[test for test in quickest if test in reaching and seconds[test] < 1],
                [test for test in quickest if test in reaching and seconds[test] >= 1]]
        for row in filter(None, rows):
            if failed := run_tests(row, 20 + 5 * max(seconds[test] for test in row)):
                return failed
        return "survived"
    finally:
        target.write_text(original)


# --- The report ---

NOT_SEEDED = ("does not compile", "changes nothing")


def report(results):
    rows = collections.defaultdict(lambda: [0, 0])
    for result in results:
        if result["result"] not in NOT_SEEDED:
            row = rows[result["file"].split("/")[0]]
            row[0] += result["result"] != "survived"
            row[1] += 1
    for result in sorted(results, key=lambda result: (result["file"], result["line"])):
        if result["result"] == "survived":
            print(f"{result['file']}:{result['line']}: {result['kind']}: {result['was']}"
                  + (f"  ->  {result['is']}" if result["is"] else ""))
    print("\n| sources | noticed |\n|---|---|")
    for name, (noticed, all_of_them) in sorted(rows.items()):
        print(f"| {name} | {noticed} of {all_of_them} |")
    total = [sum(column) for column in zip(*rows.values())] or [0, 0]
    print(f"| all | {total[0]} of {total[1]} |")


def main():
    arguments = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    arguments.add_argument("--files", nargs="+", metavar="FILE", help="only of these files, or folders")
    arguments.add_argument("--count", type=int, default=100, help="so many faults in all (default: 100)")
    arguments.add_argument("--seed", type=int, default=1, help="of the choice (default: 1)")
    arguments.add_argument("--minutes", type=float, default=60, help="starts no further fault after so long")
    arguments.add_argument("--again", action="store_true", help="also those that survived before")
    arguments.add_argument("--report", action="store_true", help="only tells what is known of the faults chosen")
    given = arguments.parse_args()

    names = subprocess.run(["git", "ls-files", "--", *(given.files or SOURCES)], cwd=ROOT, capture_output=True,
                           text=True, check=True).stdout.split()
    names = [name for name in names if name.startswith(SOURCES) and name.endswith((".cpp", ".hpp", ".h", ".c"))
             and "/template/" not in name]
    if not names:
        arguments.error("--files: no source of the project is there")
    faults = sorted((fault for name in names for fault in faults_of(name)), key=lambda fault: fault["id"])
    random.Random(given.seed).shuffle(faults)
    known = {}
    if RESULTS.exists():
        known = {result["id"]: result for result in map(json.loads, RESULTS.read_text().splitlines())}
    if given.again and not given.report:
        known = {id: result for id, result in known.items() if result["result"] != "survived"}
    end = time.monotonic() + given.minutes * 60
    seconds = None
    chosen = []
    for fault in faults:
        if sum(result["result"] not in NOT_SEEDED for result in chosen) >= given.count:
            break
        if fault["id"] not in known:
            if given.report or time.monotonic() > end:
                continue
            if seconds is None:
                seconds, reach = prepare()
                sound = products()
            result = {key: fault[key] for key in ("id", "file", "line", "kind", "was", "is")}
            result["result"] = seed(fault, seconds, reach, sound)
            with RESULTS.open("a", encoding="utf-8") as file:
                file.write(json.dumps(result) + "\n")
            known[fault["id"]] = result
            print(f"{fault['file']}:{fault['line']}: {fault['kind']}: {result['result']}", file=sys.stderr)
        chosen.append(dict(known[fault["id"]], line=fault["line"]))
    report(chosen)


main()
