#!/usr/bin/env python3
"""Builds the MAA parser tables from bison's LALR(1) automaton.

bison decides the states (and their numbering); this script fixes everything
else: the shell's symbol numbers, its rule numbers (bison's rule 0 is the
shell's rule 90) and the dense encoding the parser walks:

  aulNstate[state][symbol]  0..125 shift/goto, 126 + r reduce by rule r, -1 none
  aulDefaultAction[state]   rule of the default reduction, 0 accept, -1 none
  ruleInfo[r - 1]           length, left side, mid-rule action, text

Usage:
  maa_tables.py --bison BISON --grammar MAA_Grammar.y --out FILE [--check FILE]

With --check the freshly generated FILE must equal the checked-in one.
Exits non-zero on conflicts, a state count other than 126 or a grammar symbol
without a shell number.
"""

import argparse
import os
import subprocess
import sys
import tempfile
import xml.etree.ElementTree as ET

NUM_STATE = 126
NUM_SYM = 144
NUM_RULE = 90
ACCEPT_RULE = 90

# bison name -> (shell symbol number, text used in rule descriptions)
SYMBOLS = {
    "$end": (0, "$end"),
    "$accept": (1, "$accept"),
    "error": (2, "error"),
    "IDENTIFIER": (3, None), "CONSTANT": (4, None), "STRING": (5, None),
    "';'": (6, None), "'('": (7, None), "')'": (8, None), "'+'": (9, None),
    "'-'": (10, None), "'*'": (11, None), "'/'": (12, None), "'%'": (13, None),
    "'>'": (14, None), "'<'": (15, None), "GE": (16, None), "LE": (17, None),
    "EQ": (18, None), "NE": (19, None), "'&'": (20, None), "'^'": (21, None),
    "'|'": (22, None), "'='": (23, None), "'~'": (24, None), "'!'": (25, None),
    "PE": (26, None), "ME": (27, None), "TE": (28, None), "DE": (29, None),
    "RE": (30, None), "AE": (31, None), "OE": (32, None), "EXE": (33, None),
    "LSE": (34, None), "RSE": (35, None), "PP": (36, None), "MM": (37, None),
    "LS": (38, None), "RS": (39, None), "LOR": (40, None), "LAND": (41, None),
    "','": (42, None), "'?'": (43, None), "':'": (44, None),
    "R_CHAR": (45, None), "R_SHORT": (46, None), "R_LONG": (47, None),
    "R_INT": (48, None),
    "postfix_operator": (49, None), "unary_operator": (50, None),
    "multiplicative_operator": (51, None), "additive_operator": (52, None),
    "shift_operator": (53, None), "relatinal_operator": (54, None),
    "equality_operator": (55, None), "assignment_operator": (56, None),
    "cast_operator": (57, None), "statement": (58, None), "statements": (59, None),
    "mark_0": (60, "$@0"), "expression": (61, None),
    "primary_expression": (66, None), "postfix_expression": (67, None),
    "mark_6": (69, "$@6"), "argument_expression_list": (70, None),
    "assignment_expression": (75, None), "unary_expression": (76, None),
    "cast_expression": (79, None), "multiplicative_expression": (96, None),
    "additive_expression": (101, None), "shift_expression": (105, None),
    "relatinal_expression": (109, None), "equality_expression": (115, None),
    "AND_expression": (119, None), "XOR_expression": (121, None),
    "OR_expression": (123, None), "LAND_expression": (125, None),
    "LOR_expression": (127, None), "conditional_expression": (129, None),
    "mark_65": (143, "$@65"),
}

# Marker rules run a mid-rule action: the action number is the marker's.
MID_RULE_ACTION = {"mark_0": 0, "mark_6": 6, "mark_65": 65}

# bison's own token for an unknown character; the shell's lexer never makes it.
IGNORED = {"YYUNDEF", "$undefined"}


def fail(message):
    sys.stderr.write("maa_tables: %s\n" % message)
    sys.exit(1)


def shell_number(name):
    if name not in SYMBOLS:
        fail("grammar symbol %s has no shell number" % name)
    return SYMBOLS[name][0]


def shell_text(name):
    if name not in SYMBOLS:
        fail("grammar symbol %s has no shell number" % name)
    return SYMBOLS[name][1] or name


def shell_rule(bison_rule):
    return ACCEPT_RULE if bison_rule == 0 else bison_rule


def run_bison(bison, grammar, workdir):
    xml_path = os.path.join(workdir, "MAA_Grammar.xml")
    proc = subprocess.run(
        [bison, "-Wall", "-Werror", "--xml=" + xml_path, "-o", os.path.join(workdir, "MAA_Grammar.c"), grammar],
        stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)
    if proc.returncode != 0:
        fail("bison failed:\n" + proc.stderr)
    return xml_path


def read_rules(root):
    rules = {}
    for rule in root.find("grammar").find("rules").findall("rule"):
        number = int(rule.get("number"))
        if rule.get("usefulness") != "useful":
            fail("rule %d is not useful" % number)
        lhs = rule.find("lhs").text
        rhs = [s.text for s in rule.find("rhs").findall("symbol")]
        rules[shell_rule(number)] = (lhs, rhs)
    if sorted(rules) != list(range(1, NUM_RULE + 1)):
        fail("expected rules 1..%d, got %d rules" % (NUM_RULE, len(rules)))
    return rules


def read_automaton(root):
    states = root.find("automaton").findall("state")
    if len(states) != NUM_STATE:
        fail("expected %d states, bison made %d" % (NUM_STATE, len(states)))
    nstate = [[-1] * NUM_SYM for _ in range(NUM_STATE + 1)]
    default = [-1] * NUM_STATE
    for state in states:
        s = int(state.get("number"))
        if not 0 <= s < NUM_STATE:
            fail("state number %d out of range" % s)
        if list(state.find("solved-conflicts")):
            fail("state %d has solved conflicts" % s)
        actions = state.find("actions")
        if list(actions.find("errors")):
            fail("state %d has explicit error actions" % s)

        def put(name, value):
            if name in IGNORED:
                return
            column = shell_number(name)
            if nstate[s][column] != -1:
                fail("conflict in state %d on %s" % (s, name))
            nstate[s][column] = value

        for t in actions.find("transitions").findall("transition"):
            target = int(t.get("state"))
            if not 0 <= target < NUM_STATE:
                fail("target state %d out of range" % target)
            put(t.get("symbol"), target)
        for r in actions.find("reductions").findall("reduction"):
            if r.get("enabled") != "true":
                fail("state %d has a disabled reduction (conflict)" % s)
            rule = 0 if r.get("rule") == "accept" else shell_rule(int(r.get("rule")))
            if r.get("symbol") == "$default":
                if default[s] != -1:
                    fail("state %d has two default actions" % s)
                default[s] = rule
            else:
                if rule == 0:
                    fail("state %d accepts on a look-ahead" % s)
                put(r.get("symbol"), NUM_STATE + rule)
    if default.count(0) != 1:
        fail("expected exactly one accepting state")
    return nstate, default


def rule_text(number, lhs, rhs):
    parts = ["%d: %s -> " % (number, shell_text(lhs))]
    parts.extend(shell_text(s) + " " for s in rhs)
    return "".join(parts)


def c_string(text):
    return '"' + text.replace("\\", "\\\\").replace('"', '\\"') + '"'


def render(rules, nstate, default):
    out = []
    w = out.append
    w("// Generated by src/maa/grammar/maa_tables.py from src/maa/grammar/MAA_Grammar.y;\n")
    w("// do not edit. The build's maa_grammar_tables test regenerates and compares it.\n")
    w('#include "maa/MAA_Parser.h"\n\n')
    w("// [state][symbol]: 0..125 shift or goto, 126 + r reduce by rule r, -1 use the default.\n")
    w("const S32 aulNstate[NUM_STATE + 1][NUM_SYM] = {\n")
    for s, row in enumerate(nstate):
        w("    /* %3d */ {" % s)
        for i in range(0, NUM_SYM, 24):
            chunk = ", ".join("%d" % v for v in row[i:i + 24])
            w(("" if i == 0 else "\n              ") + chunk + ("," if i + 24 < NUM_SYM else ""))
        w("},\n")
    w("};\n\n")
    w("// Rule of the default reduction per state: 0 accept, -1 syntax error.\n")
    w("const S32 aulDefaultAction[NUM_STATE] = {\n")
    for i in range(0, NUM_STATE, 16):
        w("    " + ", ".join("%d" % v for v in default[i:i + 16]) + ",\n")
    w("};\n\n")
    w("const RULEINFO ruleInfo[NUM_RULE] = {\n")
    for r in range(1, NUM_RULE + 1):
        lhs, rhs = rules[r]
        action = MID_RULE_ACTION.get(lhs, -1)
        w("    {%d, %d, %d, %s},\n" % (len(rhs), shell_number(lhs), action, c_string(rule_text(r, lhs, rhs))))
    w("};\n")
    return "".join(out)


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--bison", default="bison")
    parser.add_argument("--grammar", required=True)
    parser.add_argument("--out", required=True)
    parser.add_argument("--check", help="checked-in table source that must equal --out")
    args = parser.parse_args()

    with tempfile.TemporaryDirectory() as workdir:
        root = ET.parse(run_bison(args.bison, args.grammar, workdir)).getroot()
    rules = read_rules(root)
    nstate, default = read_automaton(root)
    text = render(rules, nstate, default)
    with open(args.out, "w", encoding="ascii") as f:
        f.write(text)
    print("maa_tables: %d states, %d rules, no conflicts" % (NUM_STATE, NUM_RULE))

    if args.check:
        with open(args.check, encoding="ascii") as f:
            if f.read() != text:
                fail("%s differs from the tables regenerated into %s" % (args.check, args.out))
        print("maa_tables: %s is up to date" % args.check)


if __name__ == "__main__":
    main()
