#!/usr/bin/env python3
"""Changes the library's sources in one place at a time and sees whether the tests notice.

A mutant is one small fault put into one line of src/ in a copy of the tree: a flipped comparison, a
number that is off by one, a dropped statement, a swapped operator. Then the tests of its folder run,
the slow ones last. Those that no test notices are printed; where nothing a caller can
see has changed, proof/equivalent-mutants.tsv says why, and they are not counted.

Tests run as root in a view of the machine in which only the copy and /tmp can be written, for a
mutant may well open another file than it should.
"""

import argparse
import collections
import os
import pathlib
import random
import re
import shutil
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parent.parent

# What a fault may replace by what. Binary operators have blanks around them here; brackets of
# templates have none.
OPERATORS = [
    (" == ", [" != "]),
    (" != ", [" == "]),
    (" < ", [" <= ", " > "]),
    (" <= ", [" < "]),
    (" > ", [" >= ", " < "]),
    (" >= ", [" > "]),
    (" && ", [" || "]),
    (" || ", [" && "]),
    (" + ", [" - "]),
    (" - ", [" + "]),
    (" * ", [" + "]),
    (" / ", [" * "]),
    (" % ", [" / "]),
    (" << ", [" >> "]),
    (" >> ", [" << "]),
    (" | ", [" & "]),
    (" & ", [" | "]),
    (" ^ ", [" | "]),
    (" += ", [" -= "]),
    (" -= ", [" += "]),
    (" |= ", [" &= "]),
    ("++", ["--"]),
    ("--", ["++"]),
    ("!", [""]),
    ("true", ["false"]),
    ("false", ["true"]),
    ("std::min(", ["std::max("]),
    ("std::max(", ["std::min("]),
]
NUMBER = re.compile(r"(?<![\w.'])(0x[0-9A-Fa-f]+|\d+)(?=[UuLl]*\b)(?![\w.']*')")
STATEMENT = re.compile(r"^(\s+)((?!return\b|case\b|using\b|throw\b|break\b|static_assert|template\b|"
                       r"goto\b|else\b|if\b|for\b|while\b|public:|private:)[\w:>.*\[\]()&, -]+?"
                       r"(\([^;{}]*\)| [-+|&]?= [^;{}]*|\+\+|--));$")
DECLARATION = re.compile(r"^\s+(auto|const|static|constexpr|[\w:<>, ]+ (const )?[&*]? ?(const )?[\w]+ ?(=|\(|\{))")


def code_of(line):
    """The part of a line that is code, with texts blanked out so that columns stay."""
    line = re.sub(r'L?"(\\.|[^"\\])*"', lambda m: " " * len(m.group()), line)
    line = re.sub(r"L?'(\\.|[^'\\])+'", lambda m: " " * len(m.group()), line)
    return line.split("//")[0]


def one_more(number):
    """A number of the code plus one, in its own base."""
    if number.startswith("0x"):
        return hex(int(number, 16) + 1)
    if number.startswith("0") and number != "0":
        return "0" + format(int(number, 8) + 1, "o")
    return str(int(number) + 1)


def mutations_of(line):
    """All faulty versions of a line of code."""
    code = code_of(line)
    if not code.strip() or code.lstrip().startswith(("#", "*", "/*", "}")):
        return
    if re.search(r"static_assert|__attribute__\(\(init|namespace|using |template <", code):
        return
    for old, news in OPERATORS:
        for found in re.finditer(re.escape(old), code):
            at = found.start()
            if old == "!" and code[at + 1] == "=":
                continue
            if old in ("true", "false") and not re.match(r"\b%s\b" % old, code[at:]):
                continue
            for new in news:
                yield line[:at] + new + line[at + len(old):]
    for found in NUMBER.finditer(code):
        yield line[:found.start()] + one_more(found.group()) + line[found.end():]
    statement = STATEMENT.match(code.rstrip())
    if statement and not DECLARATION.match(code):
        yield statement.group(1) + ";"


def all_mutants(tree):
    """Every mutant of the sources, as (file, number of the line, the line, its faulty version)."""
    result = []
    for path in sorted((tree / "src").rglob("*")):
        if path.suffix not in (".cpp", ".h"):
            continue
        for number, line in enumerate(path.read_text().splitlines()):
            for faulty in mutations_of(line):
                if faulty != line:
                    result.append((str(path.relative_to(tree)), number, line, faulty))
    return result


def chosen(mutants, seed):
    """All mutants in a random order in which no line comes twice before all have come once."""
    generator = random.Random(seed)
    generator.shuffle(mutants)
    times = collections.Counter()
    ranks = []
    for mutant in mutants:
        times[mutant[:2]] += 1
        ranks.append(times[mutant[:2]])
    return [mutant for _, mutant in sorted(zip(ranks, mutants), key=lambda pair: pair[0])]


def copy_tree(source, target):
    """What git knows of the tree, as it is now. What was built of an earlier copy stays."""
    listed = subprocess.run(["git", "-c", f"safe.directory={source}", "ls-files", "-z", "--cached",
                             "--others", "--exclude-standard"], cwd=source, check=True,
                            stdout=subprocess.PIPE).stdout
    names = {name for name in listed.decode().split("\0") if name and (source / name).is_file()}
    if target.is_dir():
        for old in [path for path in target.rglob("*") if path.is_file()]:
            name = str(old.relative_to(target))
            if not name.startswith("build/") and name not in names:
                old.unlink()
    for name in names:
        copy = target / name
        if copy.is_file() and copy.read_bytes() == (source / name).read_bytes():
            continue
        copy.parent.mkdir(parents=True, exist_ok=True)
        shutil.copyfile(source / name, copy)
        shutil.copymode(source / name, copy)


class Suite:
    """The tests of a copy of the tree, built with one fault after another."""

    def __init__(self, tree, jobs):
        self.tree, self.jobs = tree, jobs
        self.build = tree / "build" / "i386-dev"
        self.costs = self.build / "Testing" / "Temporary" / "CTestCostData.txt"

    def prepare(self):
        """Builds everything without a fault; the tests pass then."""
        # Warnings in a mutant do not matter, and a shared library that changed asks for no
        # new linking.
        subprocess.run(["cmake", "--preset", "i386-dev", "-DKORU_WERROR=OFF", "-DKORU_COMPACT=OFF",
                        "-DCMAKE_LINK_DEPENDS_NO_SHARED=ON"], cwd=self.tree, check=True,
                       stdout=subprocess.DEVNULL)
        if not self.compiles():
            sys.exit("mutants: the tree does not build")
        self.costs.unlink(missing_ok=True)
        failing = self.failing([])
        if failing:
            sys.exit(f"mutants: {failing} fails without a fault")
        self.hurry()

    def hurry(self):
        """ctest starts with the tests that took longest; here the first failure ends the run. So it
        finds the longest times at the quickest tests, as an average of many. And a test that hangs
        is given up after a few times the time that it takes."""
        times = {name: float(cost) for name, _, cost in
                 (row.split() for row in self.costs.read_text().split("---")[0].splitlines())}
        self.costs.write_text("".join(f"{name} 1000000000 {1000 / (cost + 0.01)}\n"
                                      for name, cost in times.items()) + "---\n")
        tests = self.build / "tests" / "CTestTestfile.cmake"
        tests.write_text(re.sub(
            r'(?<=set_tests_properties\(\[=\[)(\w+)(\]=\] .*TIMEOUT ")\d+',
            lambda m: f"{m[1]}{m[2]}{10 + int(5 * times.get(m[1], 10))}", tests.read_text()))

    def compiles(self):
        return subprocess.run(["cmake", "--build", str(self.build), "--parallel", str(self.jobs)],
                              cwd=self.tree, stdout=subprocess.DEVNULL,
                              stderr=subprocess.DEVNULL).returncode == 0

    def failing(self, selection):
        """The name of the first test that fails, or an empty text. What it reports comes from the
        log, since the last line of a run that ends itself may be missing."""
        script = ("mount --make-rprivate / && mount --bind {0} {0} && mount -t tmpfs tmpfs /tmp && "
                  "mount -o remount,bind,ro / && cd {0}/build/i386-dev && "
                  "exec ctest --stop-on-failure --parallel {1} \"$@\"")
        if str(self.tree).startswith("/tmp/"):
            sys.exit("mutants: the copy cannot be below /tmp")
        run = subprocess.run(["unshare", "-m", "bash", "-c",
                              script.format(self.tree, self.jobs), "bash"] + selection,
                             stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                             stderr=subprocess.STDOUT, text=True, errors="replace", check=False)
        if run.returncode == 0:
            return ""
        failed = re.findall(r"\*\*\*\S* *(?:Failed|Timeout|Exception)|(\S+) \((?:Failed|Timeout|[A-Z]+)\)",
                            run.stdout)
        names = [name for name in failed if name]
        return names[0] if names else "a test"

    def verdict(self, mutant):
        """What became of a mutant: "does not compile", the test that noticed it, or ""."""
        name, number, line, faulty = mutant
        path = self.tree / name
        text = path.read_text()
        lines = text.splitlines()
        lines[number] = faulty
        path.write_text("\n".join(lines) + "\n")
        try:
            if not self.compiles():
                return "does not compile"
            own = f"^({FAMILIES[name.split('/')[1]]})$"
            return self.failing(["-L", own, "-LE", "^slow$"]) or \
                self.failing(["-L", own, "-L", "^slow$"])
        finally:
            path.write_text(text)


# The folders of the tests that know a folder of the sources best.
FAMILIES = {
    "text": "text|settings",
    "concurrency": "concurrency|structured",
    "process": "process|file",
    "system": "system|process",
    "file": "file|structured|faults",
    "settings": "settings|structured|faults",
    "records": "records|structured|faults",
    "time": "time",
}


def key_of(mutant):
    return (mutant[0], mutant[2].strip(), mutant[3].strip())


def read_equivalent(path):
    """File, line and faulty line of each mutant that changes nothing a caller can see."""
    if not path.is_file():
        return set()
    rows = [line.split("\t") for line in path.read_text().splitlines() if not line.startswith("#")]
    return {tuple(row[:3]) for row in rows}


def read_mutants(path, tree):
    """The mutants of an earlier run, found again in these sources by the text of their lines."""
    result = []
    for row in path.read_text().splitlines():
        verdict, name, line, faulty = row.split("\t")
        if verdict == "does not compile":
            continue
        places = [p for p in (tree / "src").rglob("*.*")
                  if p.suffix in (".cpp", ".h") and line in map(str.strip, p.read_text().splitlines())]
        if not places:
            continue
        path = next((p for p in places if p.name == pathlib.Path(name).name), places[0])
        lines = path.read_text().splitlines()
        number = next(n for n, text in enumerate(lines) if text.strip() == line)
        indent = lines[number][:len(lines[number]) - len(lines[number].lstrip())]
        result.append((str(path.relative_to(tree)), number, lines[number], indent + faulty))
    return result


def main():
    arguments = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    arguments.add_argument("count", type=int, help="how many mutants that compile")
    arguments.add_argument("--seed", type=int, default=1, help="another seed makes other mutants")
    arguments.add_argument("--results", type=pathlib.Path, help="a table of what became of each; a "
                           "run that finds it goes on after its last row")
    arguments.add_argument("--again", type=pathlib.Path, help="the mutants of that table")
    arguments.add_argument("--jobs", type=int, default=os.cpu_count())
    arguments.add_argument("--list", action="store_true", help="only print the mutants")
    options = arguments.parse_args()

    tree = ROOT / "build" / "proof" / "mutants"
    results = options.results or ROOT / "build" / "proof" / f"mutants-{options.seed}.tsv"
    if options.list:
        for mutant in chosen(all_mutants(ROOT), options.seed)[:options.count]:
            print("\t".join(key_of(mutant)))
        return 0
    copy_tree(ROOT, tree)
    mutants = read_mutants(options.again, tree) if options.again \
        else chosen(all_mutants(tree), options.seed)
    equivalent = read_equivalent(ROOT / "proof" / "equivalent-mutants.tsv")
    done = {}
    if results.is_file():
        for row in results.read_text().splitlines():
            verdict, *key = row.split("\t")
            done[tuple(key)] = verdict

    suite = Suite(tree, options.jobs)
    suite.prepare()
    caught, survivors, excused = 0, [], []
    for mutant in mutants:
        if caught + len(survivors) + len(excused) == options.count:
            break
        key = key_of(mutant)
        if key not in done:
            done[key] = suite.verdict(mutant) or "survived"
            with results.open("a") as table:
                table.write("\t".join((done[key],) + key) + "\n")
        if done[key] == "does not compile":
            continue
        if done[key] != "survived":
            caught += 1
        elif key in equivalent:
            excused.append(key)
        else:
            survivors.append(key)
    for key in survivors:
        print("survived: {}\n    {}\n    {}".format(*key))
    judged = caught + len(survivors)
    print(f"mutants: {caught} of {judged} caught"
          f" ({100 * caught / max(judged, 1):.1f}%), {len(excused)} more change nothing to be seen")
    return 0


if __name__ == "__main__":
    sys.exit(main())
