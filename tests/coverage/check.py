#!/usr/bin/env python3
"""Compares what the tests reach with the committed list of what they do not; see uncovered.txt for the list's form.

    check.py REPORT_JSON LIST SOURCE_FOLDER

REPORT_JSON is gcovr's. Prints a table by folder. Each difference is a line of output and makes the check fail: a line that
is not covered and not listed (in the form it would have in the list), a listed one that is covered by now or is not there
any more, and a group of folders of whose branches less is covered than the list asks for.
"""
import collections
import json
import os
import re
import sys

Line = collections.namedtuple('Line', 'path function text')
Covered = collections.namedtuple('Covered', 'covered all')


class Entry:
    """Lines of the same wording in the same function are told apart by their number only."""

    def __init__(self):
        self.never = 0
        self.sometimes = 0


class Listed:
    def __init__(self, path):
        self.path = path
        self.lines = collections.defaultdict(Entry)
        self.floors = []  # (folders, per cent)
        kind = None
        with open(path, encoding='utf-8') as file:
            for number, text in enumerate(file, 1):
                text = text.strip()
                if not text or text.startswith('#'):
                    continue
                head = re.fullmatch(r'(never|sometimes|branches):\s*(.*)', text)
                if head:
                    kind = self.begin(number, *head.groups())
                elif kind is None:
                    self.refuse(number, 'no reason before it')
                else:
                    self.add(number, kind, text)

    def refuse(self, number, why):
        raise SystemExit(f'{self.path}:{number}: {why}')

    def begin(self, number, kind, rest):
        if kind == 'branches':
            floor = re.fullmatch(r'(\d+(?:\.\d+)?) % of (.+)', rest)
            if floor is None:
                self.refuse(number, 'not "branches: NUMBER % of FOLDER/ ..."')
            self.floors.append((floor.group(2).split(), float(floor.group(1))))
            return None
        if len(rest.split()) < 3:
            self.refuse(number, 'that is no reason')
        return kind

    def add(self, number, kind, text):
        parts = [part.strip() for part in text.split(' | ', 2)]
        if len(parts) != 3:
            self.refuse(number, 'not "FILE | FUNCTION | LINE"')
        entry = self.lines[Line(*parts)]
        setattr(entry, kind, getattr(entry, kind) + 1)


def short(name):
    """The function's own name: without its class, its parameters, and what a lambda in it is called."""
    name = re.sub(r'^decltype .* ::|\(anonymous namespace\)|\[abi:\w+\]|::\{lambda.*', '', name)
    plain, depth = '', 0
    for sign in name:
        depth += (sign == '<') - (sign == '>')
        if depth == 0 and sign == '(':
            break
        if depth == 0 and sign != '>':
            plain += sign
    return re.split(r'::|\s', plain)[-1] or name


def names_by_line(functions):
    """For each line from which on a function's lines come, its name."""
    return sorted((function['lineno'], short(function['name'])) for function in functions)


class Reached:
    """What gcovr says: how many lines of each wording there are and how many of them are not covered."""

    def __init__(self, report, source):
        self.all = collections.Counter()
        self.missed = collections.Counter()
        self.lines = collections.defaultdict(lambda: Covered(0, 0))
        self.branches = collections.defaultdict(lambda: Covered(0, 0))
        self.places = collections.defaultdict(list)
        for file in report['files']:
            self.read(file, source)

    def read(self, file, source):
        path = file['file']
        with open(os.path.join(source, path), encoding='utf-8') as text:
            texts = text.read().split('\n')
        names = names_by_line(file['functions'])
        folder = folder_of(path)
        for line in file['lines']:
            if line.get('gcovr/noncode') or line.get('gcovr/excluded'):
                continue
            number, covered = line['line_number'], line['count'] > 0
            function = next((name for start, name in reversed(names) if start <= number), '-')
            key = Line(path, function, texts[number - 1].strip())
            self.all[key] += 1
            if not covered:
                self.missed[key] += 1
                self.places[key].append(number)
            self.lines[folder] = plus(self.lines[folder], covered, 1)
            branches = line['branches']
            self.branches[folder] = plus(self.branches[folder], sum(branch['count'] > 0 for branch in branches), len(branches))


def plus(figure, covered, count):
    return Covered(figure.covered + covered, figure.all + count)


def folder_of(path):
    parts = path.split('/')
    return '/'.join(parts[:3] if parts[0] == 'platform' else parts[:1]) + '/'


def per_cent(figure):
    return 100 * figure.covered / figure.all if figure.all else 100.0


def total(figures, folders):
    chosen = [figure for folder, figure in figures.items() if folder.startswith(tuple(folders))]
    return Covered(sum(figure.covered for figure in chosen), sum(figure.all for figure in chosen))


def print_table(reached):
    print(f'{"folder":<28}{"lines":>14}{"":>9}{"branches":>14}')
    for folder in [*sorted(reached.lines), '']:
        print(f'{folder or "all":<28}', end='')
        for figures in (reached.lines, reached.branches):
            figure = total(figures, [folder])
            print(f'{figure.covered:>6} of {figure.all:<5}{per_cent(figure):>6.1f} %', end='  ')
        print()


def compare(listed, reached):
    differences = []
    for line in sorted(set(reached.missed) | set(listed.lines)):
        entry, missed = listed.lines[line], reached.missed[line]
        known = entry.never + entry.sometimes
        if known > reached.all[line]:
            differences.append(f'listed, but not there: {" | ".join(line)}')
        elif missed > known:
            numbers = ', '.join(map(str, reached.places[line]))
            differences.append(f'not covered: {" | ".join(line)}    (line {numbers})')
        elif missed < entry.never:
            differences.append(f'listed, but covered: {" | ".join(line)}')
    return differences


def compare_branches(listed, reached):
    differences = []
    for folders, floor in listed.floors:
        figure = total(reached.branches, folders)
        if figure.all == 0:
            differences.append(f'no branches in {" ".join(folders)}')
        elif per_cent(figure) < floor:
            differences.append(f'branches of {" ".join(folders)}: {per_cent(figure):.1f} %, less than {floor} %')
        print(f'branches of {" ".join(folders)}: {per_cent(figure):.1f} %, at least {floor} % wanted')
    return differences


def main():
    with open(sys.argv[1], encoding='utf-8') as file:
        reached = Reached(json.load(file), sys.argv[3])
    listed = Listed(sys.argv[2])
    print_table(reached)
    differences = compare_branches(listed, reached) + compare(listed, reached)
    if not reached.all:
        differences.append('the report has no lines')
    for difference in differences:
        print(difference)
    return 1 if differences else 0


if __name__ == '__main__':
    sys.exit(main())
