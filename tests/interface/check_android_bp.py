#!/usr/bin/env python3
"""Compares Android.bp with what CMake builds, so that the two cannot drift apart.

    check_android_bp.py ANDROID_BP TARGETS_JSON

TARGETS_JSON is written by CMake, see CMakeLists.txt beside this file. Each difference is a line of output and
makes the check fail.
"""
import json
import re
import sys

TOKEN = re.compile(r'\s+|//[^\n]*|/\*.*?\*/|(?P<string>"(?:[^"\\]|\\.)*")|(?P<word>\w+)|(?P<sign>[\[\]{}:,])', re.S)


class Blueprint:
    """The part of the Blueprint language that Android.bp uses: modules of strings, flags, lists and maps."""

    def __init__(self, text):
        self.tokens = []
        position = 0
        while position < len(text):
            match = TOKEN.match(text, position)
            if match is None:
                raise SystemExit(f'Android.bp: cannot read {text[position:position + 20]!r}')
            if match.lastgroup:
                self.tokens.append(match.group())
            position = match.end()
        self.tokens.reverse()

    def take(self, expected=None):
        token = self.tokens.pop() if self.tokens else 'the end'
        if expected not in (None, token):
            raise SystemExit(f'Android.bp: {token} where {expected} was expected')
        return token

    def modules(self):
        """Every module by its name, with its type under 'type' and what it takes from its defaults filled in."""
        modules = {}
        while self.tokens:
            kind = self.take()
            self.take('{')
            module = {'type': kind, **self.properties()}
            if module['name'] in modules:
                raise SystemExit(f'Android.bp: there are two of {module["name"]}')
            modules[module['name']] = module
        return {name: complete(module, modules) for name, module in modules.items()}

    def properties(self):
        found = {}
        while self.tokens[-1] != '}':
            name = self.take()
            self.take(':')
            found[name] = self.value()
            if self.tokens[-1] == ',':
                self.take()
        self.take('}')
        return found

    def value(self):
        token = self.take()
        if token == '{':
            return self.properties()
        if token == '[':
            values = []
            while self.tokens[-1] != ']':
                values.append(self.value())
                if self.tokens[-1] == ',':
                    self.take()
            self.take(']')
            return values
        return json.loads(token)


def complete(module, modules):
    """The module with its defaults' properties: lists come before its own, other values only where it has none."""
    whole = dict(module)
    for name in reversed(module.get('defaults', [])):
        for key, value in complete(modules[name], modules).items():
            if isinstance(value, list) and key != 'defaults':
                whole[key] = value + whole.get(key, [])
            else:
                whole.setdefault(key, value)
    return whole


# What CMake gives some files alone and Android.bp all of them, where it does no harm.
EVERYWHERE = {'-U_FORTIFY_SOURCE'}

differences = []


def compare(what, android, cmake):
    """Both are collections of strings, whose order does not matter."""
    differences.extend(f'{what}: only Android.bp has {entry}' for entry in sorted(set(android) - set(cmake)))
    differences.extend(f'{what}: only CMake has {entry}' for entry in sorted(set(cmake) - set(android)))


def compare_library(modules, cmake):
    library = modules['libtavoosal']
    unwindable = modules['libtavoosal_unwindable']
    # What CMake gives single files is, there, a library of its own.
    special = {source: options for source, options in cmake['source_options'].items() if set(options) - EVERYWHERE}
    compare('library', library['srcs'] + unwindable['srcs'], cmake['sources'])
    compare('files with options of their own', unwindable['srcs'], special)
    for source, options in special.items():
        compare(f'options of {source}', unwindable['cflags'], library['cflags'] + options)
    for source, options in cmake['source_options'].items():
        compare(f'options of {source}', EVERYWHERE & set(library['cflags']), EVERYWHERE & set(options) or EVERYWHERE)
    compare('linked in whole', library['whole_static_libs'], ['libtavoosal_unwindable'])
    for module in (library, unwindable):
        name = module['name']
        compare(f'{name}: exported folders', module['export_include_dirs'], cmake['public_folders'])
        compare(f'{name}: folders', module['local_include_dirs'] + module['export_include_dirs'], cmake['folders'])
        compare(f'{name}: definitions', definitions(module), cmake['definitions'])
        compare(f'{name}: warnings', warnings(module), cmake['warnings'])
    compare('export map', [library['version_script']], cmake['version_scripts'])
    compare('headers alone', modules['libtavoosal_headers']['export_include_dirs'], cmake['public_folders'])


def definitions(module):
    return [flag[2:] for flag in module['cflags'] if flag.startswith('-D')]


def warnings(module):
    own = ['-fno-exceptions', '-fasynchronous-unwind-tables', '-fexceptions', *EVERYWHERE]
    flags = module['cflags'] + module['cppflags']
    return [flag for flag in flags if not flag.startswith('-D') and flag not in own]


def compare_tests(modules, cmake):
    compare('test support', modules['libtavoosal_test_support']['srcs'], cmake['support'] + cmake['kit'])
    tests = {name: module for name, module in modules.items() if module['type'] == 'cc_test'}
    compare('tests', tests, [f'tavoosal_{name}' for name in cmake['tests']])
    for name, sources in cmake['tests'].items():
        module = tests.get(f'tavoosal_{name}')
        if module:
            compare(name, module['srcs'], sources)


def main():
    with open(sys.argv[1], encoding='utf-8') as file:
        modules = Blueprint(file.read()).modules()
    with open(sys.argv[2], encoding='utf-8') as file:
        cmake = json.load(file)
    compare_library(modules, cmake['library'])
    compare_tests(modules, cmake)
    for difference in differences:
        print(difference)
    return 1 if differences else 0


if __name__ == '__main__':
    sys.exit(main())
