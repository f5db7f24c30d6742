#!/usr/bin/python3
"""Runs a program on a terminal of its own and draws what the screen shows in the end, as SVG.

Without --until that is what is there when the program has ended. With it, it is the first screen that the regular
expression is found in, and then the program gets the key of --quit.
"""

import argparse
import fcntl
import os
import pty
import re
import select
import struct
import sys
import termios
import time
from xml.sax.saxutils import escape

import pyte

CELL, LINE, SIZE = 8.4, 19, 14  # a character's width, a line's height, the font's size
MARGIN, TITLE = 16, 34

BACKGROUND, FRAME, TEXT, FAINT = "#161b22", "#6e7681", "#e6edf3", "#9198a1"
# By pyte's names, in which yellow is brown.
COLOURS = {"red": "#ff7b72", "green": "#56d364", "brown": "#e3b341", "blue": "#79c0ff", "magenta": "#d2a8ff",
           "cyan": "#56d4dd", "black": FAINT}


class Terminal:
    """A program, and the screen it writes to."""

    def __init__(self, command, columns, rows):
        self.screen = pyte.Screen(columns, rows)
        self.stream = pyte.ByteStream(self.screen)
        self.pid, self.fd = pty.fork()
        if self.pid == 0:
            fcntl.ioctl(0, termios.TIOCSWINSZ, struct.pack("HHHH", rows, columns, 0, 0))
            os.environ["TERM"] = "xterm-256color"
            os.execvp(command[0], command)

    def read(self, seconds):
        """Whether the program still has the terminal, after it wrote something or the time passed."""
        if select.select([self.fd], [], [], seconds)[0]:
            try:
                data = os.read(self.fd, 65536)
            except OSError:  # what Linux answers once nobody has the other end
                return False
            # The emulator knows no faint text; black, which no program shows on black, stands for it.
            self.stream.feed(data.replace(b"\033[2m", b"\033[30m"))
        return True

    def run(self, until, quit_key, seconds):
        """The rows in the end, and the program's exit status."""
        deadline = time.monotonic() + seconds
        shown = None
        while self.read(0.2):
            if time.monotonic() > deadline:
                sys.exit("there is nothing to draw after {} seconds; the screen:\n{}".format(
                    seconds, "\n".join(self.screen.display)))
            if until and shown is None and re.search(until, "\n".join(self.screen.display), re.DOTALL):
                shown = self.rows()
                os.write(self.fd, quit_key.encode())
        status = os.waitstatus_to_exitcode(os.waitpid(self.pid, 0)[1])
        if until and shown is None:
            sys.exit("the program ended with {} before there was anything to draw".format(status))
        return shown or self.rows(), status

    def rows(self):
        rows = [[self.screen.buffer[y][x] for x in range(self.screen.columns)] for y in range(self.screen.lines)]
        while rows and text_of(rows[-1]) == "":
            rows.pop()
        return rows


def text_of(row):
    return "".join(cell.data for cell in row).rstrip()


def line_of(text, colour):
    return [pyte.screens.Char(c, fg=colour) for c in text]


def abridge(rows, begin, cuts):
    """The rows from the one that begins with `begin` on; FROM..TO is replaced by a line that says how many it was."""
    texts = [text_of(row) for row in rows]

    def find(start, after=0):
        for i in range(after, len(texts)):
            if texts[i].startswith(start):
                return i
        sys.exit("no line begins with '{}':\n{}".format(start, "\n".join(texts)))

    first = find(begin) if begin else 0
    for cut in cuts:
        start, _, end = cut.partition("..")
        i = find(start, first)
        j = find(end, i)
        rows[i:j] = [line_of("  [{} more lines]".format(j - i), "black"), []]
        texts[i:j] = ["", ""]
    return rows[first:]


def runs_of(row):
    """(column, text, style) of what can be written as one; columns are kept by beginning anew behind two spaces."""
    row = row[:len(text_of(row))]
    runs = []
    for x, cell in enumerate(row):
        style = (cell.fg, cell.bold)
        apart = cell.data == " " and (x + 1 == len(row) or row[x + 1].data == " " or not runs or runs[-1] is None)
        if apart:
            runs.append(None)
        elif runs and runs[-1] and runs[-1][2] == style:
            runs[-1][1] += cell.data
        else:
            runs.append([x, cell.data, style])
    return [run for run in runs if run and run[1].strip()]


def draw(rows, title):
    columns = max([80] + [len(text_of(row)) for row in rows])
    width, height = columns * CELL + 2 * MARGIN, len(rows) * LINE + TITLE + MARGIN
    svg = [
        '<svg xmlns="http://www.w3.org/2000/svg" width="{0:.0f}" height="{1:.0f}" viewBox="0 0 {0:.0f} {1:.0f}" '
        'role="img">'.format(width, height),
        "<title>{}</title>".format(escape(title)),
        "<style>text {{ font: {}px ui-monospace, 'DejaVu Sans Mono', Menlo, Consolas, monospace; white-space: pre; "
        "fill: {} }} .bold {{ font-weight: bold }} .title {{ fill: {}; text-anchor: middle }}".format(SIZE, TEXT, FAINT)
        + "".join(" .{} {{ fill: {} }}".format(name, colour) for name, colour in COLOURS.items()) + "</style>",
        '<rect x="0.5" y="0.5" width="{:.0f}" height="{:.0f}" rx="8" fill="{}" stroke="{}"/>'.format(
            width - 1, height - 1, BACKGROUND, FRAME),
        '<text class="title" x="{:.0f}" y="21">{}</text>'.format(width / 2, escape(title)),
    ]
    for y, row in enumerate(rows):
        for x, text, (colour, bold) in runs_of(row):
            names = " ".join(([colour] if colour in COLOURS else []) + (["bold"] if bold else []))
            # The length keeps columns under one another in whatever font there is.
            svg.append('<text{} x="{:.1f}" y="{:.0f}" textLength="{:.1f}" xml:space="preserve">{}</text>'.format(
                ' class="{}"'.format(names) if names else "", MARGIN + x * CELL, TITLE + (y + 0.75) * LINE,
                len(text) * CELL, escape(text)))
    return "\n".join(svg + ["</svg>", ""])


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("--title", required=True)
    parser.add_argument("--columns", type=int, default=100)
    parser.add_argument("--rows", type=int, default=24)
    parser.add_argument("--until", help="draw the first screen in which this regular expression is found")
    parser.add_argument("--quit", default="q", help="the key that then ends the program")
    parser.add_argument("--seconds", type=float, default=120, help="the longest it may take")
    parser.add_argument("--begin", help="leave out what is above the line that begins so")
    parser.add_argument("--cut", action="append", default=[], metavar="FROM..TO", help="leave these lines out")
    parser.add_argument("--prompt", action="store_true", help="show the title as the command typed, above everything")
    parser.add_argument("output")
    parser.add_argument("command", nargs="+")
    options = parser.parse_args()
    rows, status = Terminal(options.command, options.columns, options.rows).run(
        options.until, options.quit, options.seconds)
    if status != 0:
        sys.exit("the program ended with {}:\n{}".format(status, "\n".join(map(text_of, rows))))
    rows = abridge(rows, options.begin, options.cut)
    if options.prompt:
        rows.insert(0, line_of("$ ", "black") + line_of(options.title, "default"))
    with open(options.output, "w", encoding="utf-8") as file:
        file.write(draw(rows, options.title))


main()
