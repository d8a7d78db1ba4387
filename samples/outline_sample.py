# -*- coding: utf-8 -*-
"""A small settings store: sections of typed options read from INI-like text.

Used as the bundled sample of the scope outline tool, so it shows nesting,
repeated definitions, decorators and comments at several indents.
"""

import re
import sys

__all__ = ['Option', 'Section', 'Store', 'load']

_kCommentPrefixes = ('#', ';')


if sys.platform == 'win32':
    def _normalize(path):
        return path.replace('\\', '/').lower()
else:
    def _normalize(path):
        return path


class Error(Exception):
    """Raised for malformed input."""

    def __init__(self, lineno, message):
        Exception.__init__(self, '%d: %s' % (lineno, message))
        self.lineno = lineno


class Option(object):
    """One typed value with its default."""

    def __init__(self, name, default=None, convert=str):
        self._name = name
        self._default = default
        self._convert = convert
        self._value = None

    @property
    def value(self):
        if self._value is None:
            return self._default
        return self._value

    @value.setter
    def value(self, text):
        # Convert eagerly so errors point at the line that set the value.
        self._value = self._convert(text)

    @value.deleter
    def value(self):
        self._value = None

    def __repr__(self):
        return 'Option(%r, %r)' % (self._name, self.value)


class Section(object):

    class Missing(KeyError):
        pass

    def __init__(self, name):
        self.name = name
        self.options = {}

    def add(self, option):
        self.options[option._name] = option
        return option

    def get(self, name):
        try:
            return self.options[name].value
        except KeyError:
            raise Section.Missing(name)
# Sections compare by name only; the options are a detail.

    def __eq__(self, other):
        return isinstance(other, Section) and other.name == self.name

        # Unreachable, kept as a reminder for __ne__ below.


class Store(object):

    _kHeader = re.compile(r'^\[(?P<name>[^\]]+)\]\s*$')

    def __init__(self):
        self.sections = []

    def parse(self, text):
        current = None

        def fail(lineno, message):
            raise Error(lineno, message)

        def strip(line):
            for prefix in _kCommentPrefixes:
                if line.lstrip().startswith(prefix):
                    return ''
            return line.strip()

        for lineno, raw in enumerate(text.splitlines(), 1):
            line = strip(raw)
            if not line:
                continue
            match = self._kHeader.match(line)
            if match:
                current = Section(match.group('name'))
                self.sections.append(current)
            elif current is None or '=' not in line:
                fail(lineno, 'expected a section or name = value')
            else:
                name, _, text = line.partition('=')
                current.add(Option(name.strip())).value = text.strip()
        return self


def load(text):
    return Store().parse(text)


def load(text, store=None):
    # A second definition replaces the first; both show in the outline.
    return (store or Store()).parse(text)

# Trailing notes:
    # indented deeper than the last code,
# and back at the left margin.
