"""Reads a source with clang and finds the places that can be changed, and how."""

import collections
import os
import re
import subprocess
import sys

sys.path.append("/usr/lib/python3/dist-packages")  # Where Debian has python3-clang.
from clang import cindex
from clang.cindex import CursorKind as Kind, TypeKind

cindex.Config.set_library_file("libclang-14.so.1")

# What a point does to the text in its range; the outermost first where two have one range.
SWAP_FIRST, SWAP_SECOND, STATEMENT, RETURN, SWITCH, DECISION, EXPRESSION = range(7)

Point = collections.namedtuple("Point", "start end form changes")
# `original` and `changed` are for people; `text` is what stands in the source instead.
Change = collections.namedtuple("Change", "function operator original changed text")

BOUNDARY = {"<": "<=", "<=": "<", ">": ">=", ">=": ">"}
EQUALITY = {"==": "!=", "!=": "=="}
ARITHMETIC = {"+": "-", "-": "+", "*": "+", "/": "*", "%": "/", "<<": ">>", ">>": "<<", "&": "|", "|": "&",
              "^": "|", "+=": "-=", "-=": "+=", "|=": "&=", "&=": "|=", "<<=": ">>=", ">>=": "<<=",
              "*=": "+=", "/=": "*=", "^=": "|="}
LITERALS = {Kind.INTEGER_LITERAL, Kind.CHARACTER_LITERAL, Kind.FLOATING_LITERAL, Kind.CXX_BOOL_LITERAL_EXPR}
FUNCTIONS = {Kind.FUNCTION_DECL, Kind.CXX_METHOD, Kind.CONSTRUCTOR, Kind.DESTRUCTOR, Kind.CONVERSION_FUNCTION,
             Kind.FUNCTION_TEMPLATE}
SCOPES = {Kind.NAMESPACE, Kind.CLASS_DECL, Kind.STRUCT_DECL, Kind.UNION_DECL, Kind.CLASS_TEMPLATE,
          Kind.CLASS_TEMPLATE_PARTIAL_SPECIALIZATION, Kind.LINKAGE_SPEC, Kind.UNEXPOSED_DECL}
CASTS = {Kind.CXX_STATIC_CAST_EXPR, Kind.CXX_REINTERPRET_CAST_EXPR, Kind.CXX_CONST_CAST_EXPR,
         Kind.CXX_DYNAMIC_CAST_EXPR, Kind.CSTYLE_CAST_EXPR, Kind.CXX_FUNCTIONAL_CAST_EXPR}
NUMBERS = {TypeKind.BOOL, TypeKind.CHAR_U, TypeKind.UCHAR, TypeKind.CHAR16, TypeKind.CHAR32, TypeKind.USHORT,
           TypeKind.UINT, TypeKind.ULONG, TypeKind.ULONGLONG, TypeKind.CHAR_S, TypeKind.SCHAR, TypeKind.WCHAR,
           TypeKind.SHORT, TypeKind.INT, TypeKind.LONG, TypeKind.LONGLONG, TypeKind.FLOAT, TypeKind.DOUBLE,
           TypeKind.ENUM}
UNKNOWN = {TypeKind.DEPENDENT, TypeKind.UNEXPOSED, TypeKind.INVALID}


def resource_directory(compiler="clang++"):
    return subprocess.check_output([compiler, "-print-resource-dir"], text=True).strip()


def function_of(cursor):
    """The name that a reader would look for: the function with its class."""
    names = [cursor.spelling]
    parent = cursor.semantic_parent
    while parent is not None and parent.kind in (Kind.CLASS_DECL, Kind.STRUCT_DECL, Kind.CLASS_TEMPLATE):
        names.insert(0, parent.spelling or "(unnamed)")
        parent = parent.semantic_parent
    return re.sub(r"<.*>", "", "::".join(names))


class Source:
    """The points of one source."""

    def __init__(self, path, arguments):
        with open(path, "rb") as file:
            self.text = file.read().decode("latin-1")
        unit = cindex.Index.create().parse(
            path, args=arguments, options=cindex.TranslationUnit.PARSE_DETAILED_PROCESSING_RECORD)
        wrong = [str(each) for each in unit.diagnostics if each.severity >= cindex.Diagnostic.Error]
        if wrong:
            raise SystemExit(f"mutants: {path} does not compile: {wrong[0]}")
        self.path = path
        self.points = []
        self.function = ""
        self.clean = self.without_comments(unit)
        own = [child for child in unit.cursor.get_children()
               if child.location.file is not None and child.location.file.name == path]
        self.macros = [(child.extent.start.offset, child.extent.end.offset) for child in own
                       if child.kind == Kind.MACRO_INSTANTIATION]
        self.directives = [match.span() for match in re.finditer(r"(?m)^[ \t]*#.*$", self.text)]
        for child in own:
            self.declaration(child)

    def without_comments(self, unit):
        """The text in which comments and ends of lines are blanks, so that it fits on one line."""
        text = list(self.text)
        for token in unit.get_tokens(extent=unit.cursor.extent):
            if token.kind == cindex.TokenKind.COMMENT:
                for index in range(token.extent.start.offset, token.extent.end.offset):
                    text[index] = " "
        return "".join(" " if each == "\n" else each for each in text)

    # Text

    def span(self, cursor):
        return cursor.extent.start.offset, cursor.extent.end.offset

    def words(self, start, end):
        return " ".join(self.clean[start:end].split())

    def usable(self, start, end):
        if start >= end:
            return False
        if any(begin < end and start < stop for begin, stop in self.directives):
            return False
        return all(stop <= start or end <= begin or (start <= begin and stop <= end)
                   for begin, stop in self.macros)

    def in_macro(self, start, end):
        return any(begin <= start and end <= stop for begin, stop in self.macros)

    def add(self, start, end, form, *changes):
        """Each change: what it is called, what people read for before and after, and the text."""
        if changes and self.usable(start, end):
            self.points.append(Point(start, end, form, [
                Change(self.function, operator, original, changed, text)
                for operator, original, changed, text in changes]))

    def replace(self, start, end, operator, text):
        self.add(start, end, EXPRESSION, (operator, self.words(start, end), " ".join(text.split()), text))

    # Declarations

    def declaration(self, cursor):
        kind = cursor.kind
        if kind in FUNCTIONS:
            self.definition(cursor)
        elif kind in (Kind.FIELD_DECL, Kind.VAR_DECL):
            if kind == Kind.FIELD_DECL:
                self.function = function_of(cursor)
                self.variable(cursor, is_overwritten=cursor.semantic_parent.kind == Kind.STRUCT_DECL)
        elif kind in SCOPES:
            for child in cursor.get_children():
                self.declaration(child)

    def definition(self, cursor):
        children = list(cursor.get_children())
        bodies = [child for child in children if child.kind in (Kind.COMPOUND_STMT, Kind.CXX_TRY_STMT)]
        if not bodies or not self.clean.startswith("{", bodies[-1].extent.start.offset):  # Written by the compiler.
            return
        head = self.clean[cursor.extent.start.offset:bodies[-1].extent.start.offset]
        if "consteval" in head or "= default" in head:
            return
        outer, self.function = self.function, function_of(cursor)
        for child in children:
            if child.kind.is_expression() and cursor.kind == Kind.CONSTRUCTOR:
                self.expression(child)
        self.statement(bodies[-1])
        self.function = outer

    def variable(self, cursor, is_overwritten=True):
        """Its initial value, unless the compiler has to know it."""
        start, end = self.span(cursor)
        name = cursor.location.offset
        if re.search(r"\bconstexpr\b", self.clean[start:name]):
            return
        constant = cursor.type.is_const_qualified() and cursor.type.get_canonical().kind in NUMBERS
        for child in cursor.get_children():
            first, last = self.span(child)
            if not child.kind.is_expression() or first <= name:
                continue
            if self.clean[name:first].rstrip().endswith("["):
                continue
            if constant and not self.runs(child):
                continue
            # Most are overwritten by who fills the variable: nothing can tell.
            if is_overwritten and (self.clean[first:last].strip() in ("0", "false", "{}", "{0}", "nullptr")
                                   or cursor.kind == Kind.FIELD_DECL and "::" in self.clean[first:last]):
                continue
            self.expression(child)

    def runs(self, cursor):
        """Whether an expression depends on anything that is not known before."""
        if cursor.kind == Kind.DECL_REF_EXPR:
            return not self.is_constant(cursor)
        if cursor.kind in (Kind.CALL_EXPR, Kind.MEMBER_REF_EXPR, Kind.CXX_THIS_EXPR):
            return True
        return any(self.runs(child) for child in cursor.get_children())

    def is_constant(self, cursor):
        what = cursor.referenced
        if what is None:
            return False
        if what.kind == Kind.ENUM_CONSTANT_DECL:
            return True
        if what.kind != Kind.VAR_DECL or what.type.get_canonical().kind not in NUMBERS:
            return False
        start = what.extent.start
        if start.file is None:
            return False
        tokens = [token.spelling for token in what.get_tokens()][:6]
        return "constexpr" in tokens

    # Statements

    def statement(self, cursor):
        """A statement, or an expression that stands as one."""
        kind = cursor.kind
        children = list(cursor.get_children())
        if kind == Kind.COMPOUND_STMT:
            for child in children:
                self.statement(child)
            self.swaps(children)
        elif kind == Kind.DECL_STMT:
            for child in children:
                if child.kind == Kind.VAR_DECL:
                    self.variable(child)
        elif kind == Kind.IF_STMT:
            self.branch(cursor, children)
        elif kind == Kind.WHILE_STMT and len(children) == 2:
            self.decision(children[0], loops=True)
            self.statement(children[1])
        elif kind == Kind.DO_STMT and len(children) == 2:
            self.statement(children[0])
            self.decision(children[1], loops=True)
        elif kind == Kind.FOR_STMT:
            self.loop(cursor, children)
        elif kind == Kind.CXX_FOR_RANGE_STMT:
            for child in children[:-1]:
                if child.kind.is_expression():
                    self.expression(child)
            self.statement(children[-1])
        elif kind == Kind.SWITCH_STMT:
            self.switch(cursor, children)
        elif kind in (Kind.CASE_STMT, Kind.DEFAULT_STMT):
            self.statement(children[-1])
        elif kind == Kind.RETURN_STMT:
            self.returned(cursor, children)
        elif kind in (Kind.BREAK_STMT, Kind.CONTINUE_STMT):
            self.drop(cursor, f"drop-{self.words(*self.span(cursor))}")
        elif kind in (Kind.CXX_TRY_STMT, Kind.CXX_CATCH_STMT):
            for child in children:
                if child.kind in (Kind.COMPOUND_STMT, Kind.CXX_CATCH_STMT):
                    self.statement(child)
        elif kind.is_expression():
            words = self.words(*self.span(cursor))
            # Room made beforehand, names that are only mentioned, and what cannot be.
            if re.search(r"\.reserve\(|^static_cast<void>\(\w+\)$|^assert\(", words):
                return
            self.drop(cursor, "drop-wipe" if re.search(r"(?i)wipe|explicit_bzero", words) else "drop-statement")
            self.expression(cursor)

    def drop(self, cursor, operator):
        start, end = self.span(cursor)
        self.add(start, end, STATEMENT, (operator, self.words(start, end), "", ""))

    def swaps(self, children):
        for first, second in zip(children, children[1:]):
            if not (self.calls(first) and self.calls(second)):
                continue
            (start, end), (from_, to) = self.span(first), self.span(second)
            texts = self.words(start, end), self.words(from_, to)
            if texts[0] == texts[1] or not (self.usable(start, end) and self.usable(from_, to)):
                continue
            both = f"{texts[0]}; {texts[1]}", f"{texts[1]}; {texts[0]}"
            change = Change(self.function, "swap-statements", *both, texts[1])
            self.points.append(Point(start, end, SWAP_FIRST, [change]))
            self.points.append(Point(from_, to, SWAP_SECOND, [change]))

    def calls(self, cursor):
        if not cursor.kind.is_expression():
            return False
        return cursor.kind == Kind.CALL_EXPR or any(self.calls(child) for child in cursor.get_children())

    def branch(self, cursor, children):
        words = self.clean[cursor.extent.start.offset:]
        if re.match(r"if\s+(constexpr|consteval)\b", words):
            for child in children[1:]:
                self.statement(child)
            return
        bodies = 1
        if len(children) > 2 and "else" in self.clean[children[-2].extent.end.offset:children[-1].extent.start.offset]:
            bodies = 2
        head = children[:-bodies]
        for child in head[:-1]:
            if child.kind == Kind.VAR_DECL:
                self.variable(child)
            else:
                self.statement(child) if child.kind == Kind.DECL_STMT else None
        if head and head[-1].kind.is_expression() and not any(child.kind == Kind.VAR_DECL for child in head):
            self.decision(head[-1])
        for child in children[-bodies:]:
            self.statement(child)

    def loop(self, cursor, children):
        start = self.clean.index("(", cursor.extent.start.offset)
        depth, marks, end = 0, [], start
        for end in range(start, cursor.extent.end.offset):
            each = self.clean[end]
            depth += (each in "([{") - (each in ")]}")
            if each == ";" and depth == 1:
                marks.append(end)
            if depth == 0:
                break
        for child in children[:-1]:
            first, _ = self.span(child)
            if first < marks[0]:
                for inner in child.get_children() if child.kind == Kind.DECL_STMT else ():
                    self.variable(inner, is_overwritten=False)
            elif first < marks[1]:
                self.decision(child, loops=True)
            else:
                # A loop that never moves only hangs.
                for inner in child.get_children():
                    self.expression(inner)
        self.statement(children[-1])

    def switch(self, cursor, children):
        condition, body = children[-2], children[-1]
        start, end = self.span(condition)
        changes = []
        labels = []
        self.labels(body, labels)
        for label in labels:
            text = self.words(*self.span(label))
            changes.append(("drop-case", f"case {text}", "", text))
        if len(children) == 2 and condition.type.get_canonical().kind != TypeKind.BOOL:
            self.add(start, end, SWITCH, *changes)
        self.expression(condition)
        self.statement(body)

    def labels(self, cursor, found):
        for child in cursor.get_children():
            if child.kind == Kind.CASE_STMT:
                inner = list(child.get_children())
                found.append(inner[0])
                self.labels(child, found)
            elif child.kind in (Kind.COMPOUND_STMT, Kind.DEFAULT_STMT):
                self.labels(child, found)

    def returned(self, cursor, children):
        start, end = self.span(cursor)
        if not children:
            self.add(start, end, STATEMENT, ("drop-return", "return", "", ""))
            return
        value = children[0]
        text = self.words(*self.span(value))
        inner = self.plain(value)
        is_bool = value.type.get_canonical().kind == TypeKind.BOOL
        constant = inner.kind in LITERALS or (inner.kind == Kind.DECL_REF_EXPR and self.is_constant(inner))
        if is_bool and not constant:
            self.decision(value)
            return
        empty = text in ("{}", "nullptr", "std::nullopt", '""', "*this") or text.startswith("std::forward")
        if not (is_bool or constant or empty):
            self.add(start, end, RETURN, ("return-nothing", f"return {text}", "return {}", ""))
        self.expression(value)

    # Expressions

    def plain(self, cursor):
        """The expression inside what is only implied, and inside parentheses."""
        while cursor.kind in (Kind.UNEXPOSED_EXPR, Kind.PAREN_EXPR):
            children = list(cursor.get_children())
            if len(children) != 1:
                break
            cursor = children[0]
        return cursor

    def decision(self, cursor, loops=False):
        """What decides where to go on."""
        inner = self.plain(cursor)
        start, end = self.span(inner)
        if inner.kind in LITERALS:
            return
        words = self.words(start, end)
        changes = [("always-false", words, "false", "false")]
        if not loops:
            changes.insert(0, ("always-true", words, "true", "true"))
        self.add(start, end, DECISION, *changes)
        self.expression(inner, decides=True)

    def expression(self, cursor, decides=False):
        """`decides`: it is tried as true and as false already."""
        inner = self.plain(cursor)
        kind = inner.kind
        span = self.span(inner)
        if self.in_macro(*span):
            if inner.kind in LITERALS:
                self.constant(*span)
            return
        handler = {
            Kind.BINARY_OPERATOR: self.binary,
            Kind.COMPOUND_ASSIGNMENT_OPERATOR: self.binary,
            Kind.UNARY_OPERATOR: self.unary,
            Kind.CONDITIONAL_OPERATOR: self.conditional,
            Kind.CALL_EXPR: self.call,
            Kind.LAMBDA_EXPR: self.lambda_,
        }.get(kind)
        if handler is not None:
            handler(inner, decides)
        elif kind in LITERALS:
            self.constant(*span)
        elif kind == Kind.STRING_LITERAL:
            self.string(*span)
        elif kind == Kind.DECL_REF_EXPR:
            if self.is_constant(inner):
                self.constant(*span)
        elif kind == Kind.CXX_UNARY_EXPR:  # sizeof
            if self.clean[span[0]:].startswith("sizeof"):
                self.constant(*span)
        elif kind == Kind.MEMBER_REF_EXPR:
            for child in inner.get_children():
                if child.kind.is_expression() and child.extent.start.offset == span[0]:
                    self.expression(child)
        elif kind in CASTS:
            children = [child for child in inner.get_children() if child.kind.is_expression()]
            if children:
                self.expression(children[-1])
        else:
            for child in inner.get_children():
                if child.kind.is_expression():
                    self.expression(child)
                elif child.kind in (Kind.COMPOUND_STMT, Kind.DECL_STMT):
                    self.statement(child)

    def constant(self, start, end):
        words = self.words(start, end)
        if "memory_order" in words:  # Nothing that a test could wait for.
            return
        self.add(start, end, EXPRESSION, ("next-value", words, f"the next of {words}", f"nextValue({words})"))

    def string(self, start, end):
        words = self.clean[start:end]
        match = re.match(r'"(?:[^"\\]|\\.)', words)
        if match is None or '"' in words[match.end():-1].replace('\\"', "") or not words.endswith('"'):
            return
        letter = "#" if words[1] != "#" else "*"
        self.replace(start, end, "change-text", f'"{letter}{words[match.end():]}')

    def operator_of(self, cursor):
        children = list(cursor.get_children())
        return self.clean[children[0].extent.end.offset:children[1].extent.start.offset].strip()

    def binary(self, cursor, decides):
        children = list(cursor.get_children())
        if len(children) != 2:
            return
        self.operation(cursor, children[0], children[1], decides)

    def operation(self, cursor, left, right, decides):
        (start, end), (from_, to), (first, last) = self.span(cursor), self.span(left), self.span(right)
        operator = self.clean[to:first].strip()
        texts = self.clean[from_:to].strip(), self.clean[first:last].strip()
        if operator in ("&&", "||"):
            kept = [texts[0]]
            inner = self.plain(left)
            # In a chain each condition is dropped once.
            if inner.kind != Kind.BINARY_OPERATOR or self.operator_of(inner) != operator:
                kept.append(texts[1])
            self.add(start, end, EXPRESSION,
                     *[("drop-condition", self.words(start, end), " ".join(each.split()), f"static_cast<bool>({each})")
                       for each in kept])
            self.expression(left, decides=True)
            self.expression(right, decides=True)
            return
        if operator in BOUNDARY:
            self.replace(start, end, "boundary", f"{texts[0]} {BOUNDARY[operator]} {texts[1]}")
        elif operator in EQUALITY:
            if not decides:
                self.replace(start, end, "equality", f"{texts[0]} {EQUALITY[operator]} {texts[1]}")
            for child in (left, right):
                inner = self.plain(child)
                if inner.kind not in LITERALS and not (inner.kind == Kind.DECL_REF_EXPR and self.is_constant(inner)):
                    self.expression(child)
            return
        elif operator in ARITHMETIC:
            kinds = {each.type.get_canonical().kind for each in (cursor, left, right)}
            if kinds <= NUMBERS | UNKNOWN:
                self.replace(start, end, "arithmetic", f"{texts[0]} {ARITHMETIC[operator]} {texts[1]}")
        self.expression(left)
        self.expression(right)

    def unary(self, cursor, decides):
        children = list(cursor.get_children())
        if len(children) != 1:
            return
        start, end = self.span(cursor)
        first, last = self.span(children[0])
        operand = self.clean[first:last]
        operator = (self.clean[start:first] + self.clean[last:end]).strip()
        if operator == "!" and not decides:
            self.replace(start, end, "negation", f"static_cast<bool>({operand})")
        elif operator in ("-", "~"):
            self.replace(start, end, "arithmetic", operand)
        elif operator in ("++", "--"):
            other = "--" if operator == "++" else "++"
            self.replace(start, end, "arithmetic", f"{other}{operand}" if first > start else f"{operand}{other}")
        self.expression(children[0], decides=decides and operator == "!")

    def conditional(self, cursor, decides):
        children = list(cursor.get_children())
        if len(children) == 3:
            self.decision(children[0])
            self.expression(children[1])
            self.expression(children[2])

    def lambda_(self, cursor, decides):
        for child in cursor.get_children():
            if child.kind == Kind.COMPOUND_STMT:
                self.statement(child)
            elif child.kind.is_expression():
                self.expression(child)

    def call(self, cursor, decides):
        start, end = self.span(cursor)
        arguments = [each for each in cursor.get_arguments() if each is not None]
        name = cursor.spelling
        if name in ("operator==", "operator!=", "operator<", "operator>", "operator<=", "operator>=") \
                and len(arguments) == 2 and self.span(arguments[0])[1] <= self.span(arguments[1])[0]:
            self.operation(cursor, arguments[0], arguments[1], decides)
            return
        if name in ("min", "max"):
            other = {"min": "max", "max": "min"}[name]
            text, count = re.subn(rf"^(\s*(?:std::)?){name}\b", rf"\g<1>{other}", self.clean[start:end])
            if count:
                self.replace(start, end, "min-max", text)
        what = cursor.referenced
        # To a comparison for equality, a swap, a sum and a product the order is all one.
        if (what is None or what.kind != Kind.CONSTRUCTOR) and not re.search(
                r"(?i)equal|memcmp|same|min|max|^swap$|^saturating(Add|Multiply)$|_(add|mul)_overflow$", name):
            self.swapped_arguments(cursor, arguments)
        for child in cursor.get_children():
            if child.kind.is_expression():
                self.expression(child)

    def swapped_arguments(self, cursor, arguments):
        start, end = self.span(cursor)
        for first, second in zip(arguments, arguments[1:]):
            (a, b), (c, d) = self.span(first), self.span(second)
            if not (start < a < b <= c < d <= end) or self.clean[b:c].strip() != ",":
                continue
            kinds = [each.type.get_canonical() for each in (self.plain(first), self.plain(second))]
            if kinds[0].spelling != kinds[1].spelling or self.words(a, b) == self.words(c, d):
                continue
            text = self.clean[start:a] + self.clean[c:d] + self.clean[b:c] + self.clean[a:b] + self.clean[d:end]
            self.replace(start, end, "swap-arguments", text)


def points_of(path, arguments):
    source = Source(path, arguments)
    return source.points
