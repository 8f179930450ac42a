#!/usr/bin/env python3
"""Checks of the manual pages in man/.

  man_pages.py symbols MANDIR NM MAP:LIB...  every exported symbol has a page
  man_pages.py lint MANDIR MANDOC            mandoc finds nothing to warn about
  man_pages.py extract MANDIR OUTDIR         writes the pages' examples as files
  man_pages.py run PROGRAM ACL EXPECTED      runs an example, compares its output
  man_pages.py installed MANDIR CMAKE BUILD  installs the pages of BUILD, renders each

Examples are the .EX/.EE blocks of the pages. Each follows a comment line
'.\\" example: KIND' where KIND is c (a C program, compiled against the
public headers), output (what the C program before it prints when run with
the ACL file of kxacl(5) as its argument), acl (an ACL file) or shell.
"""
import fnmatch
import os
import pathlib
import re
import shutil
import subprocess
import sys
import tempfile

SKIPPED = 77  # ctest's SKIP_RETURN_CODE of these tests
KINDS = {'c', 'output', 'acl', 'shell'}
ESCAPES = {'\\e': '\\', '\\-': '-', "\\(aq": "'", '\\&': ''}
ESCAPE = re.compile(r'\\(e|-|\(aq|&)')


def pages(mandir):
    return sorted(p for p in pathlib.Path(mandir).glob('man[1-9]/*.[1-9]'))


def link_target(page):
    """The page that a link page sources, or None for a page of its own."""
    text = page.read_text()
    m = re.fullmatch(r'\.so (man\d/[\w.]+)\n', text)
    return m.group(1) if m else None


def exported(nm, library, version_script):
    """The defined dynamic symbols of library that the script makes global."""
    script = pathlib.Path(version_script).read_text()
    globs = re.search(r'global:(.*?)local:', script, re.S).group(1)
    patterns = [g.strip() for g in globs.split(';') if g.strip()]
    out = subprocess.run([nm, '-D', '--defined-only', library], check=True,
                         capture_output=True, text=True).stdout
    names = {line.split()[2].split('@')[0] for line in out.splitlines()
             if len(line.split()) == 3}
    return {n for n in names if any(fnmatch.fnmatchcase(n, p) for p in patterns)}


def check_symbols(mandir, nm, pairs):
    man3 = pathlib.Path(mandir) / 'man3'
    missing, found = [], 0
    for pair in pairs:
        script, library = pair.split(':', 1)
        for name in sorted(exported(nm, library, script)):
            found += 1
            if not (man3 / f'{name}.3').is_file():
                missing.append(name)
    if found == 0:
        sys.exit('no exported symbol found')
    if missing:
        sys.exit('exported symbols without a page or link: ' + ' '.join(missing))
    print(f'{found} exported symbols, each with a page or link')


def lint(mandir, mandoc):
    """Every page lints clean; a link page must lead to a page that does."""
    failed = []
    for page in pages(mandir):
        target = link_target(page)
        if target:
            if not (pathlib.Path(mandir) / target).is_file():
                failed.append(f'{page}: links to missing {target}')
            continue
        result = subprocess.run([mandoc, '-T', 'lint', str(page.relative_to(mandir))],
                                cwd=mandir, capture_output=True, text=True)
        if result.returncode != 0 or result.stdout or result.stderr:
            failed.append(result.stdout + result.stderr)
    if failed:
        sys.exit('\n'.join(failed))
    print(f'{len(pages(mandir))} pages lint clean')


def unescape(line, where):
    text = ESCAPE.sub(lambda m: ESCAPES['\\' + m.group(1)], line)
    if '\\' in ESCAPE.sub('', line):
        sys.exit(f'{where}: an escape that examples may not use: {line}')
    return text


def examples(page):
    """(kind, text) of each example block of a page."""
    kind, block, found = None, None, []
    for number, line in enumerate(page.read_text().split('\n'), 1):
        where = f'{page}:{number}'
        if block is not None:
            if line == '.EE':
                found.append((kind, ''.join(block)))
                kind, block = None, None
            else:
                block.append(unescape(line, where) + '\n')
        elif line.startswith('.\\" example:'):
            kind = line.split(':', 1)[1].strip()
            if kind not in KINDS:
                sys.exit(f'{where}: unknown example kind {kind}')
        elif line == '.EX':
            if kind is None:
                sys.exit(f'{where}: an example without its kind')
            block = []
    return found


def extract(mandir, outdir):
    """Writes NAME.c, NAME.out (its output) and NAME.acl for every example of
    every page, NAME being the page's name and a number after the first;
    prints the names of the C programs, and of those with an output."""
    out = pathlib.Path(outdir)
    out.mkdir(parents=True, exist_ok=True)
    programs = []
    for page in pages(mandir):
        count, last = {}, None
        for kind, text in examples(page):
            if kind == 'shell':
                continue
            count[kind] = count.get(kind, 0) + 1
            suffix = '' if count[kind] == 1 else f'_{count[kind]}'
            name = f'{page.name.replace(".", "_")}{suffix}'
            if kind == 'output':
                if last is None:
                    sys.exit(f'{page}: an output example without a program before it')
                name, kind = last, 'out'
            file = out / f'{name}.{kind}'
            if not file.exists() or file.read_text() != text:
                file.write_text(text)
            if kind == 'c':
                programs.append(name)
                last = name
    print(';'.join(programs), end='')


def run(program, acl, expected):
    """Runs program with a copy of the ACL file in a directory of its own,
    so that each run compiles a fresh file, and compares what it prints."""
    with tempfile.TemporaryDirectory() as work:
        copy = pathlib.Path(work) / 'resource.acl'
        shutil.copyfile(acl, copy)
        result = subprocess.run([str(pathlib.Path(program).resolve()), str(copy)], cwd=work, capture_output=True, text=True,
                                timeout=60)
    want = pathlib.Path(expected).read_text()
    if result.returncode != 0 or result.stdout != want:
        sys.exit(f'{program} exited {result.returncode} and printed:\n{result.stdout}'
                 f'{result.stderr}\nThe page shows:\n{want}')
    print(f'{program}: output as on its page')


def installed(mandir, cmake, build):
    """Installs the pages into a fresh prefix: every page of the tree must be
    there, and render with man -l (which follows link pages)."""
    with tempfile.TemporaryDirectory() as prefix:
        # The install scripts of the two folders that install pages, so that
        # nothing else of the tree (such as files that installing writes into
        # the build tree) is touched by a test that runs beside others.
        for folder in ('man', 'tool'):
            subprocess.run([cmake, f'-DCMAKE_INSTALL_PREFIX={prefix}', '-P',
                            str(pathlib.Path(build) / folder / 'cmake_install.cmake')],
                           check=True, capture_output=True)
        installed_man = pathlib.Path(prefix) / 'share' / 'man'
        wanted = [p.relative_to(mandir) for p in pages(mandir)] + [pathlib.Path('man1/kxacl.1')]
        missing = [str(w) for w in wanted if not (installed_man / w).is_file()]
        if missing:
            sys.exit('not installed: ' + ' '.join(missing))
        man = shutil.which('man')
        if not man:
            print(f'{len(wanted)} pages installed; man is not there to render them')
            return
        failed = []
        for page in wanted:
            result = subprocess.run([man, '-l', str(page)], cwd=installed_man,
                                    capture_output=True, text=True,
                                    env=dict(os.environ, MANWIDTH='80', MANPAGER='cat',
                                             PAGER='cat'))
            if result.returncode != 0 or result.stderr or 'NAME' not in result.stdout:
                failed.append(f'{page}: {result.stderr}')
        if failed:
            sys.exit('man -l fails:\n' + '\n'.join(failed))
        print(f'{len(wanted)} pages installed and rendered')


def main(argv):
    command, args = argv[1], argv[2:]
    if command == 'symbols':
        check_symbols(args[0], args[1], args[2:])
    elif command == 'lint':
        mandoc = shutil.which(args[1]) if args[1] else None
        if not mandoc:
            # CI installs it: there, a missing mandoc is a failure.
            if os.environ.get('CI') == 'true':
                sys.exit('mandoc is not installed')
            print('mandoc is not installed: skipped')
            sys.exit(SKIPPED)
        lint(args[0], mandoc)
    elif command == 'extract':
        extract(args[0], args[1])
    elif command == 'run':
        run(*args)
    elif command == 'installed':
        installed(*args)
    else:
        sys.exit(f'unknown command {command}')


if __name__ == '__main__':
    main(sys.argv)
