"""Writes a source again with all of its mutants inside, each asking whether it is switched on.

No line moves: lines that tests read off the log keep their shape, and a compiler's complaint about
a line and a column leads back to the mutant that it is about."""

import collections
import re

from .source import (DECISION, EXPRESSION, RETURN, STATEMENT, SWAP_FIRST, SWAP_SECOND, SWITCH)

Mutant = collections.namedtuple("Mutant", "name path function operator original changed line")

OPEN, MIDDLE, CLOSE = "\x01", "\x02", "\x03"


class Node:
    def __init__(self, point, names):
        self.start, self.end, self.form = point.start, point.end, point.form
        self.changes = list(zip(names, point.changes))
        self.children = []


def nest(points):
    """The points as a forest; what overlaps without being inside is left out."""
    roots, stack = [], []
    for node in sorted(points, key=lambda node: (node.start, -node.end, node.form)):
        while stack and stack[-1].end <= node.start:
            stack.pop()
        if stack and node.end > stack[-1].end:
            continue
        (stack[-1].children if stack else roots).append(node)
        stack.append(node)
    return roots


class Rewriting:
    """`points` of the text of the source at `path`. A mutant's name says where it is and what it
    does, so that it stays the same while the source is edited elsewhere."""

    def __init__(self, path, text, points):
        self.path, self.text = path, text
        self.mutants = {}
        counts = collections.Counter()
        nodes, swapped = [], None
        for point in points:
            names = []
            for change in point.changes:
                key = (f"{path}: {change.function}: {change.operator}: {change.original} -> "
                       f"{change.changed or 'nothing'}")
                if point.form == SWAP_SECOND:
                    # The other half of the mutant that SWAP_FIRST has begun.
                    names.append(swapped)
                    continue
                counts[key] += 1
                name = key if counts[key] == 1 else f"{key} (number {counts[key]})"
                if point.form == SWAP_FIRST:
                    swapped = name
                line = text.count("\n", 0, point.start) + 1
                self.mutants[name] = Mutant(name, path, change.function, change.operator, change.original,
                                            change.changed, line)
                names.append(name)
            nodes.append(Node(point, names))
        self.roots = nest(nodes)

    def write(self, numbers):
        """The text in which the mutants of `numbers` (name to number) are; remembers where each is."""
        self.numbers = numbers
        marked = self.between(0, len(self.text), self.roots)
        return self.without_marks(marked)

    def between(self, start, end, nodes):
        pieces, at = [], start
        for node in nodes:
            pieces += [self.text[at:node.start], self.node(node)]
            at = node.end
        return "".join(pieces + [self.text[at:end]])

    def node(self, node):
        inner = self.between(node.start, node.end, node.children)
        changes = [(self.numbers[name], change.text) for name, change in node.changes if name in self.numbers]
        if not changes:
            return inner
        number, text = changes[0]
        asks = f"mutant({number}U)"
        if node.form == SWAP_FIRST:
            return f"{OPEN}{number}{MIDDLE}if ({asks}) {{ {text}; }} {CLOSE}{inner}"
        if node.form == RETURN:
            return f"{OPEN}{number}{MIDDLE}if ({asks}) return {{}}; else {CLOSE}{inner}"
        if node.form in (STATEMENT, SWAP_SECOND):
            return f"{OPEN}{number}{MIDDLE}if ({asks}) {{}} else {inner}{CLOSE}"
        if node.form == SWITCH:
            value = f"switched{number}"
            tries = " || ".join(f"{OPEN}{number}{MIDDLE}({value} == ({text}) && mutant({number}U)){CLOSE}"
                                for number, text in changes)
            return f"auto {value} = {inner}; ({tries}) ? static_cast<decltype({value})>(-77) : {value}"
        others = "".join(f"{OPEN}{number}{MIDDLE}mutant({number}U) ? ({text}) : {CLOSE}" for number, text in changes)
        if node.form == DECISION:
            return f"({others}static_cast<bool>({inner}))"
        return f"{OPEN}{number}{MIDDLE}({others}({inner})){CLOSE}"

    def without_marks(self, marked):
        """Takes the marks out and keeps them as spans of the written text: (size, start, end, number)."""
        out, size, open_, self.spans = [], 0, [], []
        for piece in re.split(f"({OPEN}[0-9]+{MIDDLE}|{CLOSE})", marked):
            if piece.startswith(OPEN):
                open_.append((size, int(piece[1:-1])))
            elif piece == CLOSE:
                start, number = open_.pop()
                self.spans.append((size - start, start, size, number))
            else:
                out.append(piece)
                size += len(piece)
        self.written = "".join(out)
        self.spans.sort()
        return self.written

    def blamed(self, line, column):
        """The numbers of the mutants that a complaint about this place of the written text is about."""
        starts = [0] + [match.end() for match in re.finditer("\n", self.written)]
        if line > len(starts):
            return set()
        at = starts[line - 1] + column - 1
        for _, start, end, number in self.spans:
            if start <= at < end:
                return {number}
        end_of_line = starts[line] if line < len(starts) else len(self.written)
        return {number for _, start, end, number in self.spans if start < end_of_line and end > starts[line - 1]}
