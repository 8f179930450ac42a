#!/usr/bin/env python3
"""Replays the mutants of an earlier mutate.py run against the current
sources, wherever their lines now stand.

For each mutant of --before (by default only those killed then), the
mutated line's text (before, stripped of indentation) is looked up in the
same file, else in any file matching --search; the nearest match to the old
line number is mutated the same way (before -> after, indentation kept),
the tree rebuilt and the tests run. Verdicts: killed, survived, no build,
gone (the line exists nowhere any more).

  scripts/mutants-replay.py --src . --build build --before mutants-before.json \
      [--only acl/readfile.cpp] [--all] [--test 'ctest ...'] [--json out.json]
"""
import argparse, glob, json, os, signal, subprocess, sys, time

def run(cmd, cwd, timeout):
    try:
        return subprocess.run(cmd, cwd=cwd, shell=True, stdout=subprocess.DEVNULL,
                              stderr=subprocess.DEVNULL, timeout=timeout).returncode
    except subprocess.TimeoutExpired:
        return "timeout"

def locate(src, rel, number, before, search):
    key = before.strip()
    candidates = [os.path.join(src, rel)] + sorted(
        p for g in search for p in glob.glob(os.path.join(src, g)))
    seen = set()
    for path in candidates:
        if path in seen or not os.path.exists(path):
            continue
        seen.add(path)
        with open(path, encoding="utf-8") as f:
            lines = f.readlines()
        hits = [i for i, l in enumerate(lines, 1) if l.strip() == key]
        if hits:
            return path, min(hits, key=lambda i: abs(i - number))
    return None, None

def main():
    ap = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    ap.add_argument("--src", default=".")
    ap.add_argument("--build", required=True)
    ap.add_argument("--before", required=True)
    ap.add_argument("--only", action="append", help="original file(s) to replay")
    ap.add_argument("--all", action="store_true", help="replay survivors too")
    ap.add_argument("--search", action="append", default=None)
    ap.add_argument("--test", default="ctest -j2 --timeout 60 -E 'fuzz|memcheck'")
    ap.add_argument("--build-cmd", default="cmake --build . -j2")
    ap.add_argument("--test-timeout", type=int, default=600)
    ap.add_argument("--json")
    args = ap.parse_args()
    src, build = os.path.abspath(args.src), os.path.abspath(args.build)
    search = args.search or ["acl/*.cpp", "acl/*.h", "cu/*.cpp", "cu/*.h"]
    data = json.load(open(args.before))
    todo = [r for r in data["results"] if (args.all or r["verdict"] == "killed")
            and (not args.only or r["file"] in args.only)]
    if run(args.build_cmd, build, 3600) != 0:
        sys.exit("the unmutated tree does not build")
    current = {}
    def restore(*_):
        for path, text in current.items():
            with open(path, "w", encoding="utf-8") as f:
                f.write(text)
        current.clear()
    signal.signal(signal.SIGINT, lambda *a: (restore(), sys.exit(130)))
    signal.signal(signal.SIGTERM, lambda *a: (restore(), sys.exit(143)))
    out, started = [], time.time()
    for i, r in enumerate(todo, 1):
        path, number = locate(src, r["file"], r["line"], r["before"], search)
        verdict, where = "gone", None
        if path:
            where = f"{os.path.relpath(path, src)}:{number}"
            with open(path, encoding="utf-8") as f:
                original = f.read()
            lines = original.splitlines(keepends=True)
            line = lines[number - 1]
            indent = line[:len(line) - len(line.lstrip())]
            lines[number - 1] = indent + r["after"].strip() + "\n"
            current[path] = original
            with open(path, "w", encoding="utf-8") as f:
                f.write("".join(lines))
            try:
                if run(args.build_cmd, build, 1800) != 0:
                    verdict = "no build"
                else:
                    rc = run(args.test, build, args.test_timeout)
                    verdict = "survived" if rc == 0 else "killed"
            finally:
                restore()
                os.utime(path, None)
        out.append(dict(r, was=r["verdict"], verdict=verdict, now_at=where))
        print(f"[{i}/{len(todo)}] {verdict:8} {r['file']}:{r['line']} {r['operator']} (was {r['verdict']}) now {where}", flush=True)
    run(args.build_cmd, build, 3600)
    print()
    for r in out:
        if r["was"] == "killed" and r["verdict"] not in ("killed",):
            print(f"{r['verdict']}: {r['file']}:{r['line']} {r['operator']}: {r['after'].strip()}")
    counts = {v: sum(r["verdict"] == v for r in out) for v in ("killed", "survived", "no build", "gone")}
    print(f"\n{counts} of {len(out)} in {time.time() - started:.0f} s")
    if args.json:
        json.dump({"results": out}, open(args.json, "w"), indent=1)

if __name__ == "__main__":
    main()
