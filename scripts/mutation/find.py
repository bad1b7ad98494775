# SPDX-License-Identifier: Apache-2.0
"""Finds the places of a source where one small, real fault fits, by the compiler's own syntax tree.

Each fault is an insertion around what it changes, so that all of them share one build:
`a < b` becomes `(keelgateFault(7) ? (a <= b) : (a < b))`. What the compiler itself evaluates (rows
of tables, labels, keys of fields) is changed in the text instead and takes a build of its own.
"""
import bisect
import dataclasses
import re
import sys

try:
    import clang.cindex as cindex
except ImportError:  # another interpreter than Debian's
    sys.path.append("/usr/lib/python3/dist-packages")
    import clang.cindex as cindex

K = cindex.CursorKind
OTHERS = {"==": ["!="], "!=": ["=="], "<": ["<=", ">="], "<=": ["<", ">"], ">": [">=", "<="],
          ">=": [">", "<"], "&&": ["||"], "||": ["&&"], "+": ["-"], "-": ["+"], "+=": ["-="],
          "-=": ["+="]}
# Nothing in these is evaluated while a program runs, or nothing that a fault could stand for.
SKIPPED = {K.STATIC_ASSERT, K.ENUM_CONSTANT_DECL, K.TYPE_ALIAS_DECL, K.TYPEDEF_DECL,
           K.TEMPLATE_TYPE_PARAMETER, K.TEMPLATE_NON_TYPE_PARAMETER,
           K.TYPE_ALIAS_TEMPLATE_DECL, K.USING_DECLARATION, K.CXX_BASE_SPECIFIER}
DECLARATIONS = {K.VAR_DECL, K.FIELD_DECL, K.PARM_DECL, K.FUNCTION_DECL, K.CXX_METHOD,
                K.FUNCTION_TEMPLATE, K.CONVERSION_FUNCTION, K.DESTRUCTOR}
FUNCTIONS = DECLARATIONS - {K.VAR_DECL, K.FIELD_DECL, K.PARM_DECL}
LEAVING = {K.RETURN_STMT, K.CXX_THROW_EXPR, K.BREAK_STMT, K.CONTINUE_STMT}
NUMBERS = {cindex.TypeKind.from_id(i) for i in range(3, 24)}
LONGEST = 600  # characters of an expression that is repeated beside its faulty form


@dataclasses.dataclass
class Fault:
    file: str
    line: int
    kind: str
    what: str
    start: int
    end: int
    folds: bool = False  # in a function that the compiler may have evaluated
    build: str | None = None  # the text that replaces start..end, where the fault takes a build of its own
    number: int = 0

    def __str__(self):
        return f"{self.file}:{self.line}: {self.kind}: {self.what}"


@dataclasses.dataclass
class Insertion:
    """`before % numbers` and `after` go around start..end once the faults have their numbers."""
    start: int
    end: int
    level: int  # 0: a statement, outside of an expression of the same extent
    before: str
    after: str
    faults: list


class Source:
    """The faults of one file."""

    def __init__(self, unit, path, name):
        self.name = name
        self.text = path.read_bytes()
        self.file = unit.get_file(str(path))
        extent = cindex.SourceRange.from_locations(
            cindex.SourceLocation.from_offset(unit, self.file, 0),
            cindex.SourceLocation.from_offset(unit, self.file, len(self.text)))
        self.tokens = [(t.extent.start.offset, t.extent.end.offset, t.spelling)
                       for t in unit.get_tokens(extent=extent)
                       if t.kind != cindex.TokenKind.COMMENT]
        self.starts = [token[0] for token in self.tokens]
        self.macros, self.insertions, self.builds, self.seen = [], [], [], set()
        self.folds = False

    # -------------------------------------------------------------------------- text

    def between(self, start, end):
        first = bisect.bisect_left(self.starts, start)
        last = bisect.bisect_left(self.starts, end)
        return self.tokens[first:last]

    def quote(self, start, end):
        return " ".join(token[2] for token in self.between(start, end))

    def line(self, offset):
        return self.text.count(b"\n", 0, offset) + 1

    def in_macro(self, start, end):
        return any(m.start <= start < m.stop and end <= m.stop for m in self.macros)

    def is_part_of_macro(self, start, end):
        return self.in_macro(start, end) and range(start, end) not in self.macros

    # -------------------------------------------------------------------------- recording

    def fault(self, kind, what, start, end, build=None):
        return Fault(self.name, self.line(start), kind, " ".join(what.split())[:160], start, end,
                     self.folds, build)

    def around(self, start, end, level, before, after, faults):
        self.insertions.append(Insertion(start, end, level, before, after, faults))

    def choose(self, start, end, kind, forms):
        """An expression that each of `forms` may take the place of."""
        old = self.quote(start, end)
        if self.in_macro(start, end) or not old or len(old) > LONGEST or (start, end) in self.seen:
            return
        self.seen.add((start, end))
        faults = [self.fault(k, f"{old} -> {form}", start, end)
                  for k, form in ((kind, f) if isinstance(f, str) else f for f in forms)]
        bodies = [form if isinstance(form, str) else form[1] for form in forms]
        before = "".join(f"keelgateFault(@) ? ({body}) : " for body in bodies)
        self.around(start, end, 1, f"({before}(", "))", faults)

    def drop(self, start, end, kind):
        """A statement that may be left out. `end` is behind its semicolon."""
        if self.in_macro(start, end) or (start, end, kind) in self.seen:
            return
        self.seen.add((start, end, kind))
        what = self.fault(kind, self.quote(start, end) + " -> nothing", start, end)
        self.around(start, end, 0, "{ if (keelgateFault(@)) {} else ", " }", [what])

    def rebuild(self, kind, what, start, end, text):
        self.builds.append(self.fault(kind, what, start, end, text))

    # -------------------------------------------------------------------------- the tree

    def visit(self, cursor, parent=None):
        if cursor.kind in SKIPPED:
            return
        start, end = extent(cursor)
        # What a macro is made of is not this file's text; a macro alone may be an operand's.
        if self.in_macro(start, end) and range(start, end) not in self.macros:
            return
        if cursor.kind in FUNCTIONS:
            head = {token[2] for token in self.between(start, cursor.location.offset)}
            if "consteval" in head:
                return
            self.folds = "constexpr" in head
        children = list(cursor.get_children())
        if cursor.kind == K.SWITCH_STMT:
            self.swap_labels(cursor)
        if cursor.kind == K.VAR_DECL and self.is_constant(cursor):
            self.rows(cursor)
            return
        if cursor.kind == K.IF_STMT:
            children = self.condition(cursor, children, start, end)
        elif cursor.kind == K.CASE_STMT:
            children = children[1:]
        elif cursor.kind == K.COMPOUND_STMT:
            self.statements(children)
        elif cursor.kind in DECLARATIONS:
            children = self.evaluated(cursor, children)
        elif cursor.kind == K.DECL_REF_EXPR:
            self.named_constant(cursor, start, end)
            return
        elif cursor.kind == K.MEMBER_REF_EXPR:
            children = [c for c in children if extent(c)[0] < cursor.location.offset]
        elif cursor.kind in (K.INTEGER_LITERAL, K.CHARACTER_LITERAL, K.CXX_BOOL_LITERAL_EXPR):
            self.literal(cursor.kind, start, end)
            return
        elif cursor.kind == K.UNARY_OPERATOR and self.quote(start, start + 1) == "!":
            self.choose(start, end, "negation", [f"bool({self.quote(start + 1, end)})"])
        if cursor.kind.is_expression():
            self.operation(cursor, start, end)
        for child in children:
            self.visit(child, cursor)

    def evaluated(self, cursor, children):
        """The children of a declaration that run: not what its type or its constraints are made
        of, nor the size of an array."""
        def runs(child):
            first, last = extent(child)
            if not child.kind.is_expression():
                return True
            if first < cursor.location.offset or cursor.kind in FUNCTIONS:
                return False
            behind = self.between(last, last + 1)
            return not (behind and behind[0][2] == "]")
        return [child for child in children if runs(child)]

    def is_constant(self, cursor):
        if any(token[2] in ("constexpr", "constinit")
               for token in self.between(extent(cursor)[0], cursor.location.offset)):
            return True
        kind = cursor.type.get_canonical()
        return kind.is_const_qualified() and kind.kind in NUMBERS and not any(
            c.kind in (K.CALL_EXPR, K.PARM_DECL, K.MEMBER_REF_EXPR, K.CXX_THIS_EXPR)
            or c.kind == K.DECL_REF_EXPR and not constant(c.referenced)
            for c in cursor.walk_preorder())

    def condition(self, cursor, children, start, end):
        head = self.between(start, end)
        if len(head) > 1 and head[1][2] == "constexpr":
            return children[1:]
        otherwise = len(children) > 2 and any(
            token[2] == "else" for token in self.between(extent(children[-2])[1],
                                                         extent(children[-1])[0]))
        branches = children[-2:] if otherwise else children[-1:]
        if not otherwise and leaves(children[-1]):
            self.drop(start, self.behind(end), "dropped check")
        for branch in branches:
            if branch.kind.is_expression() and branch.kind != K.CXX_THROW_EXPR and (
                    otherwise or not leaves(branch)):
                self.drop(extent(branch)[0], self.behind(extent(branch)[1]), "dropped statement")
        return children

    def statements(self, children):
        for child in children:
            start, end = extent(child)
            if child.kind.is_expression() and innermost(child).kind != K.CXX_THROW_EXPR:
                self.drop(start, self.behind(end), "dropped statement")

    def behind(self, end):
        """The offset behind the semicolon that follows, if one does."""
        following = self.between(end, end + 200)
        return following[0][1] if following and following[0][2] == ";" else end

    def operation(self, cursor, start, end):
        sides = operands(cursor, start, end)
        if not sides:
            return
        (first, first_end), (second, _) = sides
        operator = self.quote(first_end, second)
        if operator not in OTHERS:
            return
        if operator in "+-" and not may_subtract(cursor.type):
            return
        left, right = self.quote(first, first_end), self.quote(second, end)
        forms = [f"{left} {other} {right}" for other in OTHERS[operator]]
        if operator in ("&&", "||"):
            forms += [("dropped condition", f"bool({left})"), ("dropped condition", f"bool({right})")]
        self.choose(start, end, "operator", forms)

    def literal(self, kind, start, end):
        text = self.quote(start, end)
        if kind == K.CXX_BOOL_LITERAL_EXPR:
            self.choose(start, end, "constant", [{"true": "false", "false": "true"}.get(text, text)])
        elif kind == K.CHARACTER_LITERAL:
            self.choose(start, end, "constant", [f"decltype({text})({text} + 1)"])
        elif re.fullmatch(r"[0-9][0-9a-fA-FxXbB']*[uUlL]*", text):
            self.choose(start, end, "constant",
                        [f"{text} + 1"] if text == "0" else [f"{text} + 1", f"{text} - 1"])

    def named_constant(self, cursor, start, end):
        if constant(cursor.referenced):
            text = self.quote(start, end)
            self.choose(start, end, "constant", [f"decltype({text})({text} {change} 1)"
                                                 for change in "+-"])

    # -------------------------------------------------------------------------- own builds

    def rows(self, cursor):
        """Of a table that the compiler evaluates: the first columns of two rows exchanged, or two
        plain values."""
        tables = [c for c in cursor.walk_preorder() if c.kind == K.INIT_LIST_EXPR]
        inside = set()
        for table in tables:
            if extent(table) in inside:
                continue
            inside |= {extent(c) for c in table.get_children()}
            rows = [extent(c) for c in table.get_children()]
            inner = [c.kind == K.INIT_LIST_EXPR for c in table.get_children()]
            if len(rows) < 2 or (any(inner) and not all(inner)):
                continue
            cells = [extent(next(c.get_children(), c)) if all(inner) else extent(c)
                     for c in table.get_children()]
            rests = [self.quote(cell[1], row[1]) for cell, row in zip(cells, rows)]
            for i in range(len(rows) - 1):
                if all(inner) and rests[i] == rests[i + 1]:
                    self.rebuild("table row", f"{self.quote(*rows[i])} -> nothing", rows[i][0],
                                 rows[i + 1][0], "")
                else:
                    self.exchange("table row", cells[i], cells[i + 1])

    def swap_labels(self, cursor):
        labels = [extent(next(c.get_children())) for c in cursor.walk_preorder()
                  if c.kind == K.CASE_STMT]
        for one, other in zip(labels, labels[1:]):
            self.exchange("case label", one, other)

    def exchange(self, kind, one, other):
        (a, a_end), (b, b_end) = one, other
        if a_end > b or self.is_part_of_macro(a, a_end) or self.is_part_of_macro(b, b_end):
            return
        first, second, middle = self.text[a:a_end], self.text[b:b_end], self.text[a_end:b]
        if first and second and first != second:
            self.rebuild(kind, f"{self.quote(a, a_end)} <-> {self.quote(b, b_end)}", a, b_end,
                         (second + middle + first).decode())

    def keys(self, name, start, end):
        """The wire key of a field, or its own name where it has no other, changed."""
        if name != "FIELD":
            return
        call = self.text[start:end].decode()
        new = re.sub(r'"([^"]*)"\s*\)$', r'"\1~")', call)
        if new == call:
            new = re.sub(r"(\w+)\s*\)$", r'\1, "\1~")', call)
        self.rebuild("key", f"{call} -> {new}", start, end, new)


def extent(cursor):
    return cursor.extent.start.offset, cursor.extent.end.offset


def innermost(cursor):
    while cursor.kind == K.UNEXPOSED_EXPR:
        children = list(cursor.get_children())
        if len(children) != 1:
            break
        cursor = children[0]
    return cursor


def leaves(branch):
    children = list(branch.get_children())
    if branch.kind == K.COMPOUND_STMT:
        return bool(children) and leaves(children[-1])
    return innermost(branch).kind in LEAVING


def constant(declaration):
    if declaration is None or declaration.kind != K.VAR_DECL:
        return False
    kind = declaration.type.get_canonical()
    if not kind.is_const_qualified() or kind.kind not in NUMBERS:
        return False
    return any(t.spelling == "constexpr" for t in declaration.get_tokens())


def may_subtract(kind):
    kind = kind.get_canonical().kind
    return kind in NUMBERS or kind in (cindex.TypeKind.POINTER, cindex.TypeKind.DEPENDENT)


def operands(cursor, start, end):
    """The extents of the two sides, where the cursor is anything with two: built in, overloaded
    or rewritten by the compiler."""
    found = []

    def descend(parent):
        for child in parent.get_children():
            if extent(child) == (start, end):
                descend(child)
            elif extent(child)[0] == start or extent(child)[1] == end:
                found.append(extent(child))
    descend(cursor)
    left = max((f for f in found if f[0] == start), default=None, key=lambda f: f[1])
    right = min((f for f in found if f[1] == end), default=None, key=lambda f: f[0])
    return (left, right) if left and right and left[1] <= right[0] else None


def sources_of(unit, wanted, done):
    """The Source of each wanted file (path -> name) that this translation unit is first to show."""
    fresh = {}
    for cursor in unit.cursor.get_children():
        place = cursor.extent.start
        path = place.file and place.file.name
        if path not in wanted or path in done:
            continue
        if path not in fresh:
            fresh[path] = Source(unit, wanted[path][0], wanted[path][1])
        source = fresh[path]
        if cursor.kind == K.MACRO_INSTANTIATION:
            source.macros.append(range(*extent(cursor)))
            source.keys(cursor.spelling, *extent(cursor))
        elif cursor.kind != K.MACRO_DEFINITION:
            source.visit(cursor)
    done.update(fresh)
    return list(fresh.values())
