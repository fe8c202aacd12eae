#!/usr/bin/python3
"""Writes a copy of the sources that holds all mutants at the same time, and the list of these.

usage: instrument.py PROJECT OUTPUT
OUTPUT gets the sources in their directories, and mutants.txt: the names of the mutants, which tell what each changes
and where, in the order of their numbers from 0.

Mutants, each of them one change:
  condition     of if, for, ?: and the check macros, operands of && and ||, and comparisons elsewhere: forced true,
                forced false. A false operand of && makes the whole false, and so is no mutant of its own; the same
                goes for a true one of ||.
  statement     left out: expressions, return, break, continue, goto, logs, loops over ranges, and variables that
                act by their life alone. What would leave a function without a result returns {} instead. Leaving
                out an if, a loop with a condition or a check is the same as its condition false.
  flag          left out, of flags that are joined by |.
  constant      one higher, one lower; an index 0 only higher. Named constants change where they are used. true and
                false change places. An enumerator becomes its neighbour, which is one mutant.
Not mutated: what the compiler evaluates (constexpr variables, template arguments, array sizes, static tables),
initialisers of members, variables that others refer to, steps of loops, cases of a switch, texts and null pointers;
nor is a function's last return left out that returns a literal, a reference or what has no empty value, or whose
type is deduced.
Where the field list is expanded into statements, all fields of the list change together.
"""

import collections
import pathlib
import re
import subprocess
import sys

from clang.cindex import CursorKind as Kind
from clang.cindex import Index, TranslationUnit, TypeKind

FIELD_LIST = re.compile(
    r"#define VEMO_ATOKEN_DATA_MEMBER\(name, type, column, value\)(?P<body>(?:.*\\\n)*.*)\n"
    r'(?P<rest>#include "internal/vemo-access-token-data-member"\n#undef VEMO_ATOKEN_DATA_MEMBER\n)')
SOURCES = ("src/*.cpp", "platform/*.cpp", "grant/*.cpp", "tools/*.cpp", "include/CallLock.h")
BODIES = (Kind.FUNCTION_DECL, Kind.CXX_METHOD, Kind.CONSTRUCTOR, Kind.DESTRUCTOR, Kind.FUNCTION_TEMPLATE)
LEAVING = (Kind.BREAK_STMT, Kind.CONTINUE_STMT, Kind.GOTO_STMT, Kind.CXX_FOR_RANGE_STMT)
LABELS = (Kind.LABEL_STMT, Kind.CASE_STMT, Kind.DEFAULT_STMT)
LITERALS = (Kind.INTEGER_LITERAL, Kind.CXX_BOOL_LITERAL_EXPR, Kind.CXX_NULL_PTR_LITERAL_EXPR)
COMPARISONS = ("==", "!=", "<", ">", "<=", ">=")
NUMBER = re.compile(r"\d[\w.']*")
CONSTANT = re.compile(r"[A-Z][A-Z0-9_]*")  # as macros of constants are named, and our own ones


def one_line(text):
    return " ".join(text.replace("\\\n", " ").split())


def blank(text):
    return re.sub(r"[^\n]", " ", text)


def parsers_view(text):
    """The source with each expansion of the field list into statements written out, for one field without a
    name. All else stays in its place."""

    def write_out(match):
        body = match["body"]
        if not body.rstrip().endswith((";", "}")):
            return match[0]
        head = blank(match[0][: match.start("body") - match.start()])
        body = body.replace("\\\n", " \n").replace("##", "__").replace("#name", '"nam"')
        return head + body + "\n" + blank(match["rest"])

    return FIELD_LIST.sub(write_out, text)


def inside(cursor):
    """The expression without the parser's implicit steps around it."""
    children = list(cursor.get_children())
    while cursor.kind == Kind.UNEXPOSED_EXPR and len(children) == 1:
        cursor = children[0]
        children = list(cursor.get_children())
    return cursor


def has_default(kind):
    """Whether a value of the type can be made of nothing."""
    parts = list(kind.get_canonical().get_declaration().get_children())
    constructors = [part for part in parts if part.kind == Kind.CONSTRUCTOR]
    if constructors:
        return any(each.is_default_constructor() for each in constructors)
    return all(has_default(part.type) for part in parts if part.kind == Kind.CXX_BASE_SPECIFIER)


def place(cursor):
    return (cursor.extent.start.offset, cursor.extent.end.offset)


class Source:
    def __init__(self, path, project, mutants):
        self.path = path
        self.name = str(path.relative_to(project))
        self.text = path.read_text(encoding="ascii")
        self.mutants = mutants  # the names, of all sources; a mutant's number is its place there
        self.edits = []  # (start, end, text before, text after), outer ones first
        self.done = set()  # the conditions and the macros, by their place
        self.unused = None  # the place of the expression whose value is

    def parse(self, arguments):
        path = str(self.path)
        unit = Index.create().parse(path, arguments, [(path, parsers_view(self.text))], TranslationUnit.PARSE_NONE)
        errors = [str(diagnostic) for diagnostic in unit.diagnostics if diagnostic.severity >= 3]
        if errors:
            sys.exit("\n".join(errors))
        self.find_functions(unit.cursor, path)

    def find_functions(self, cursor, path):
        for child in cursor.get_children():
            if child.location.file and child.location.file.name != path:
                continue
            if child.kind in BODIES:
                self.function(child)
            else:
                self.find_functions(child, path)

    def function(self, cursor):
        body = [child for child in cursor.get_children() if child.kind == Kind.COMPOUND_STMT]
        if not body:
            return
        names = [cursor.spelling]
        parent = cursor.semantic_parent
        while parent.kind in (Kind.CLASS_DECL, Kind.STRUCT_DECL, Kind.CLASS_TEMPLATE):
            names.insert(0, parent.spelling)
            parent = parent.semantic_parent
        self.where = "::".join(names)
        self.cursor = cursor
        self.branch = ""
        self.result = cursor.result_type
        self.statements(body[0], last=True)

    # Mutants

    def slice(self, cursor):
        return self.text[cursor.extent.start.offset : cursor.extent.end.offset]

    def add(self, cursor, change):
        """Adds a mutant, and returns its number."""
        text = one_line(self.slice(cursor))
        parts = [text] + [part for part in (self.context, self.branch) if part not in ("", text)]
        parts = [part if len(part) <= 80 else part[:77] + "..." for part in parts]
        self.mutants.append(f"{self.name} {self.where}: {change}: " + " | ".join(parts))
        return len(self.mutants) - 1

    def wrap(self, cursor, before, after):
        self.edits.append((*place(cursor), before, after))

    def change(self, cursor, change, value, kind=""):
        """A mutant that has another value in the place of an expression, which becomes of that type."""
        self.wrap(cursor, f"mutant({self.add(cursor, change)}, {kind}(", f"), {value})")

    # Statements

    def statements(self, block, last):
        """last: the function ends after the block."""
        children = list(block.get_children())
        for i, child in enumerate(children):
            self.statement(self.labelled(child), last and i + 1 == len(children))

    def labelled(self, cursor):
        while cursor.kind in LABELS:
            *_, cursor = cursor.get_children()
        return cursor

    def statement(self, cursor, last):
        self.context = ""
        if cursor.kind == Kind.COMPOUND_STMT:
            self.statements(cursor, last)
        elif cursor.kind == Kind.IF_STMT:
            condition, *branches = cursor.get_children()
            self.expression_of_statement(condition, condition=True)
            outer = self.branch
            for word, branch in zip(("if", "else of"), branches):
                self.branch = f"{word} ({one_line(self.slice(condition))})"
                self.statement(branch, last)
            self.branch = outer
        elif cursor.kind in (Kind.FOR_STMT, Kind.WHILE_STMT, Kind.DO_STMT):
            for part in cursor.get_children():
                before = self.text[cursor.extent.start.offset : part.extent.start.offset]
                if part.kind == Kind.COMPOUND_STMT:
                    self.statement(part, False)
                else:
                    self.expression_of_statement(part, cursor.kind != Kind.FOR_STMT or before.count(";") == 1)
        elif cursor.kind == Kind.SWITCH_STMT:
            value, body = cursor.get_children()
            self.expression_of_statement(value)
            for child in body.get_children():  # where it ends the function, so does each return of it
                self.statement(self.labelled(child), last)
        elif cursor.kind == Kind.CXX_FOR_RANGE_STMT:
            self.removable(cursor)
            self.statement(list(cursor.get_children())[-1], False)
        elif cursor.kind in (Kind.CXX_TRY_STMT, Kind.CXX_CATCH_STMT):
            for child in cursor.get_children():
                if child.kind in (Kind.COMPOUND_STMT, Kind.CXX_CATCH_STMT):
                    self.statement(child, last)
        elif cursor.kind == Kind.RETURN_STMT:
            self.return_statement(cursor, last)
        elif cursor.kind == Kind.DECL_STMT:
            self.declaration(cursor)
        elif cursor.kind in LEAVING:
            self.removable(cursor)
        elif cursor.kind.is_expression():
            if not inside(cursor).spelling.startswith("VEMO_ATOKEN_CHECK_"):
                self.expression_removable(cursor, last)
            self.unused = place(inside(cursor))  # nobody looks at its value
            self.done.add(self.unused)
            self.expression_of_statement(cursor)
        elif cursor.kind != Kind.NULL_STMT:
            sys.exit(f"{self.name}:{cursor.location.line}: a statement of kind {cursor.kind.name}")

    def removable(self, cursor):
        number = self.add(cursor, "statement removed")
        self.wrap(cursor, f"if (mutant({number}, true, false)) ", "")

    def expression_removable(self, cursor, last):
        """What ends a function with a result, or another one without a condition, does not return."""
        if last and self.has_result():
            if self.has_empty_result():
                self.empty_result("statement removed", cursor)
        elif not last or self.branch or inside(cursor).kind != Kind.CXX_THROW_EXPR:
            self.removable(cursor)

    def empty_result(self, change, cursor):
        number = self.add(cursor, change)
        self.wrap(cursor, f"if (mutant({number}, false, true)) return {{}}; ", "")

    def return_statement(self, cursor, last):
        value = [inside(child) for child in cursor.get_children()]
        if not last:
            self.removable(cursor)
        elif value and not self.is_constant(value[0]) and self.has_empty_result():
            self.empty_result("result emptied", cursor)
        for child in value:
            self.expression_of_statement(child, context=self.slice(cursor))

    def is_constant(self, cursor):
        if cursor.kind == Kind.UNARY_OPERATOR:
            cursor = inside(next(cursor.get_children()))
        return cursor.kind in LITERALS or self.is_enumerator(cursor)

    def has_result(self):
        return self.result is not None and self.result.kind != TypeKind.VOID

    def has_empty_result(self):
        if not self.has_result() or self.result.kind in (TypeKind.LVALUEREFERENCE, TypeKind.AUTO):
            return False
        return has_default(self.result)

    def declaration(self, cursor):
        for variable in cursor.get_children():
            if variable.kind != Kind.VAR_DECL:
                continue
            if variable.type.get_canonical().kind == TypeKind.RECORD and not self.is_used(variable):
                self.guard(variable)
            for child in variable.get_children():
                if self.text[child.extent.end.offset] not in "]>":  # the size of an array, a template's argument
                    self.expression_of_statement(child, context=self.slice(cursor))

    def is_used(self, variable):
        return any(child.kind == Kind.DECL_REF_EXPR and child.referenced == variable
                   for child in self.cursor.walk_preorder())

    def guard(self, variable):
        number = self.add(variable, "statement removed")
        start = variable.extent.start.offset
        if self.text.startswith("const ", start):
            start += len("const ")
        end = variable.location.offset - 1
        written, whole = self.text[start:end], variable.type.get_canonical().spelling
        arguments = whole[whole.index("<") :] if "<" in whole and "<" not in written else ""  # deduced ones
        self.edits.append((start, end, f"mutant_guard<{number}, ", arguments + ">"))

    # Expressions

    def expression_of_statement(self, cursor, condition=False, context=None):
        self.context = one_line(context or self.slice(cursor))
        self.expression(cursor, condition)

    def expression(self, cursor, condition=False):
        cursor = inside(cursor)
        if cursor.location.file and cursor.location.file.name != str(self.path):
            return  # an entry of the field list, in a table
        children = list(cursor.get_children())
        operator = self.operator(cursor, children)
        if cursor.kind == Kind.CALL_EXPR and cursor.spelling.startswith("VEMO_ATOKEN_CHECK_"):
            self.check(cursor, children)
            return
        if cursor.kind == Kind.LAMBDA_EXPR:
            self.body_of_lambda(children[-1])
            return
        if condition or operator in COMPARISONS + ("&&", "||"):
            self.condition(cursor)
        self.constant(cursor)
        for i, child in enumerate(children):
            if operator == "|" and CONSTANT.fullmatch(self.slice(child)):
                if self.slice(child) == "O_RDONLY":
                    continue  # no flag at all
                self.change(child, "flag removed", 0)
                continue
            if operator in ("&&", "||"):
                self.operand(child, operator, i == 0, place(cursor) == self.unused)
            self.expression(child, cursor.kind == Kind.CONDITIONAL_OPERATOR and i == 0)

    def body_of_lambda(self, body):
        outside = self.context, self.branch, self.result, self.unused
        self.branch, self.result = "", None  # its result has the type that it has
        self.statements(body, last=True)
        self.context, self.branch, self.result, self.unused = outside

    def operator(self, cursor, children):
        """The operator between two operands, also where it is overloaded."""
        if cursor.kind == Kind.CALL_EXPR and cursor.spelling.startswith("operator"):
            return cursor.spelling.removeprefix("operator")
        if cursor.kind != Kind.BINARY_OPERATOR:
            return None
        left, right = children
        return self.text[left.extent.end.offset : right.extent.start.offset].replace("\\\n", " ").strip("() \n")

    def condition(self, cursor):
        if place(cursor) in self.done:
            return
        self.done.add(place(cursor))
        for forced in ("true", "false"):
            self.change(cursor, "condition " + forced, forced, "bool")

    def operand(self, cursor, operator, is_first, is_of_unused):
        cursor = inside(cursor)
        if is_of_unused:
            if is_first:
                self.condition(cursor)  # it decides on the second
            return
        self.done.add(place(cursor))
        forced = "true" if operator == "&&" else "false"
        self.change(cursor, "operand " + forced, forced, "bool")

    def check(self, cursor, children):
        callee, condition, *others = children
        if not cursor.spelling.endswith("_AS"):
            text = one_line(self.slice(condition)).replace("\\", "\\\\").replace('"', '\\"')
            self.wrap(callee, "", "_AS")
            self.wrap(condition, "", f', "{text}"')
        self.condition(condition)
        for child in [condition] + others:
            self.expression(child)

    def constant(self, cursor):
        text = self.slice(cursor)
        if cursor.kind == Kind.CXX_BOOL_LITERAL_EXPR:
            self.change(cursor, "constant flipped", "!" + text)
        elif self.is_enumerator(cursor):
            value = cursor.referenced.enum_value
            self.change(cursor, "constant changed", value - 1 if value else 1)
        elif cursor.kind == Kind.INTEGER_LITERAL and self.is_number(cursor) or self.is_named_constant(cursor):
            self.change(cursor, "constant +1", f"({text}) + 1ULL")
            if self.text[cursor.extent.start.offset - 1] != "[" or text not in ("0", "0U"):
                self.change(cursor, "constant -1", f"({text}) - 1ULL")

    def is_number(self, cursor):
        """Or a macro that stands for one, however many make it up."""
        text = self.slice(cursor)
        if NUMBER.fullmatch(text):
            return True
        is_new = CONSTANT.fullmatch(text) and place(cursor) not in self.done
        self.done.add(place(cursor))
        return is_new

    def is_enumerator(self, cursor):
        return (cursor.kind == Kind.DECL_REF_EXPR and cursor.referenced is not None
                and cursor.referenced.kind == Kind.ENUM_CONSTANT_DECL)

    def is_named_constant(self, cursor):
        """A constant of the file or the class."""
        if cursor.kind not in (Kind.DECL_REF_EXPR, Kind.MEMBER_REF_EXPR):
            return False
        variable = cursor.referenced
        if variable is None or variable.kind != Kind.VAR_DECL or not variable.type.is_const_qualified():
            return False
        is_number = variable.type.get_canonical().kind in (TypeKind.INT, TypeKind.UINT, TypeKind.LONG, TypeKind.ULONG)
        return is_number and variable.semantic_parent.kind not in BODIES

    # The mutated text

    def write(self, path):
        inserts = {}
        for order, (start, end, before, after) in enumerate(self.edits):
            inserts.setdefault(start, []).append(((1, -end, order), before))
            inserts.setdefault(end, []).append(((0, -start, -order), after))
        text, position = '#include "mutants.h"\n#line 1\n', 0
        for offset in sorted(inserts):
            text += self.text[position:offset] + "".join(part for _, part in sorted(inserts[offset]))
            position = offset
        text += self.text[position:]
        if not path.exists() or path.read_text(encoding="ascii") != text:
            path.write_text(text, encoding="ascii")


def main():
    project, output = (pathlib.Path(argument).resolve() for argument in sys.argv[1:])
    libraries = subprocess.run(["pkg-config", "--cflags", "jsoncpp"], check=True, stdout=subprocess.PIPE)
    arguments = ["-xc++", "-std=c++17", f"-I{project}", f"-I{project}/include", f"-I{project}/platform",
                 '-DVEMO_ATOKEN_VERSION=""', *libraries.stdout.decode().split()]
    view = ["-include", f"{project}/tests/mutation/view.h"]
    mutants = []
    for pattern in SOURCES:
        for path in sorted(project.glob(pattern)):
            source = Source(path, project, mutants)
            source.parse(arguments + (view if pattern.startswith("src") else []))
            source.write(output / source.name)
    same = collections.Counter()
    with open(output / "mutants.txt", "w", encoding="ascii") as names:
        for name in mutants:
            same[name] += 1
            names.write(f"{name} | #{same[name]}\n" if same[name] > 1 else f"{name}\n")
    print(f"{len(mutants)} mutants")


main()
