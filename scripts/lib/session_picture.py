#!/usr/bin/env python3
"""Runs a command on a terminal, types lines into it, and draws what stands there in the end.

    session_picture.py PICTURE.svg COMMAND [ARGUMENT ...] < LINES

A line of LINES is typed where the terminal shows "search> ".
"""
import html
import os
import pty
import re
import select
import sys
import time

COLUMNS, LINES = 120, 60
PROMPT = b"search> "
PATIENCE = 600  # seconds
WIDE, HIGH, EDGE, FONT = 7.5, 17, 14, 12.5  # pixels of a character, around, of the letters


def record(command, typed):
    """All bytes that the command wrote to its terminal."""
    child, terminal = pty.fork()
    if child == 0:
        os.environ.update(COLUMNS=str(COLUMNS), LINES=str(LINES), TERM="xterm")
        os.execvp(command[0], command)
    seen, end = b"", time.monotonic() + PATIENCE
    while time.monotonic() < end:
        if not select.select([terminal], [], [], 1)[0]:
            continue
        try:
            data = os.read(terminal, 65536)
        except OSError:  # the command has ended
            data = b""
        if not data:
            break
        seen += data
        if seen.endswith(PROMPT) and typed:
            time.sleep(0.3)
            os.write(terminal, typed.pop(0))
    os.close(terminal)
    if os.waitpid(child, 0)[1] != 0:
        sys.exit("session_picture: the command failed:\n" + seen.decode(errors="replace"))
    return seen.decode(errors="replace")


def screen(text):
    """Rows of (character, bold) as they stand in the end, with what the terminal understands of what is written here."""
    rows, row, column, bold, wraps = [[]], 0, 0, False, True
    for numbers, order, character in re.findall(r"\x1b\[([0-9;?]*)([A-Za-z])|([^\x1b])", text):
        if order == "m":
            bold = "1" in numbers.split(";")
        elif order == "A":
            row = max(0, row - int(numbers or 1))
        elif numbers == "?7":
            wraps = order == "h"
        elif order in ("J", "K"):
            del rows[row][column:]
            del rows[row + 1 if order == "J" else len(rows):]
        elif character == "\r":
            column = 0
        elif character:
            if column == COLUMNS and not wraps and character != "\n":
                continue
            if character == "\n" or column == COLUMNS:
                row, column = row + 1, 0
                if row == len(rows):
                    rows.append([])
            if character != "\n":
                rows[row].extend([(" ", False)] * (column - len(rows[row])))
                rows[row][column:column + 1] = [(character, bold)]
                column += 1
    return rows


def draw(rows):
    lines = []
    for number, row in enumerate(rows):
        spans = []
        for part in re.finditer(r"0+|1+", "".join(str(int(bold)) for _, bold in row)):
            text = html.escape("".join(character for character, _ in row[part.start():part.end()]))
            spans.append('<tspan class="b">%s</tspan>' % text if part.group()[0] == "1" else text)
        prompted = "".join(spans)
        if prompted.startswith("search&gt; ") or prompted.startswith("$ "):
            prompted = '<tspan class="t">%s</tspan>' % prompted
        lines.append('<text x="%d" y="%d">%s</text>' % (EDGE, EDGE + HIGH * (number + 1) - 4, prompted))
    width, height = 2 * EDGE + COLUMNS * WIDE, 2 * EDGE + HIGH * len(rows)
    return """<svg xmlns="http://www.w3.org/2000/svg" xml:space="preserve" width="%d" height="%d" viewBox="0 0 %d %d">
<style>text { font: %gpx ui-monospace, "DejaVu Sans Mono", Menlo, Consolas, monospace; fill: #d6dbe0; }
.b { font-weight: bold; fill: #ffffff; } .t { fill: #8fd18f; }</style>
<rect width="100%%" height="100%%" rx="8" fill="#1c2128"/>
%s
</svg>
""" % (width, height, width, height, FONT, "\n".join(lines))


if __name__ == "__main__":
    picture, *command = sys.argv[1:]
    typed = [line.encode() for line in sys.stdin]
    rows = screen("$ %s\r\n" % " ".join(command) + record(command, typed))
    while rows and not rows[-1]:
        rows.pop()
    with open(picture, "w", encoding="utf-8") as file:
        file.write(draw(rows))
