"""Checks the pgen grammar files in resources/pgen-grammars.

Each logical line of a standard library is parsed alone, with the completion
tokens the analyzer feeds for incomplete lines, by lib2to3's pure-Python pgen
parser under the grammar of the matching version. Lines of files the matching
interpreter accepts must parse; in files its parser rejects, the offending
line must fail too. Lines with one random edit (a token dropped, repeated,
swapped or inserted) must parse exactly when the interpreter's own parser
accepts them.

Run as a script (python -m tests.py.test_grammars --report) for the counts
over the whole corpora.
"""

import codecs
import json
import os
import re
import sys
import token
import tokenize
import unittest

from lib2to3.pgen2 import grammar as pgen_grammar
from lib2to3.pgen2 import parse as pgen_parse

from pysource import _pgengen
from tests.py import support

kGrammarDir = os.path.join(support.kRoot, 'resources', 'pgen-grammars')
kVersions = ('2.7', '3.5', '3.6', '3.7', '3.8', '3.9', '3.10', '3.11', '3.12', '3.13')

# Token numbering the analyzer passes to the parser generator.
kTokNumber2Name = dict(token.tok_name)
kTokNumber2Name.update({51: 'RARROW', 53: 'AWAIT', 54: 'ASYNC', 55: 'COLONEQUAL', 56: 'ATEQUAL', 60: 'MATCH',
                        61: 'CASE', 62: 'TYPE', 63: 'WITH_LPAR'})
kOpText2Number = dict(pgen_grammar.opmap)
kOpText2Number.update({'...': 52, '->': 51, ':=': 55, '@=': 56})
NAME, NUMBER, STRING, NEWLINE, ENDMARKER = 1, 2, 3, 4, 0
COLON, AT, AWAIT, ASYNC = 11, 50, 53, 54
kErrorToken = 201

_grammars = {}


def LoadGrammar(version):
    if version not in _grammars:
        path = os.path.join(kGrammarDir, 'Python-Grammar-' + version)
        gen = _pgengen.ParserGenerator(path, tok_number2name=kTokNumber2Name,
                                       op_text2number=kOpText2Number)
        _grammars[version] = gen.make_grammar()
    return _grammars[version]


def PrintFunctionGrammar(grammar):
    """A copy of a 2.7 grammar in which `print` is a plain name."""
    g = pgen_grammar.Grammar()
    g.__dict__.update(grammar.__dict__)
    g.keywords = dict(grammar.keywords)
    del g.keywords['print']
    return g


def RuleTexts(version):
    """Rule name -> list of rule texts (whitespace removed) of a grammar file."""
    with open(os.path.join(kGrammarDir, 'Python-Grammar-' + version)) as f:
        text = re.sub(r'#[^\n]*', '', f.read())
    rules = {}
    for m in re.finditer(r'^(\w+)\s*:(.*?)(?=^\w|\Z)', text, re.M | re.S):
        rules.setdefault(m.group(1), []).append(Squeeze(m.group(0)))
    return rules


def Squeeze(text):
    return re.sub(r'\s+', '', text)


# -- Completion of one logical line, as the analyzer does it ---------------

def _Synthetic(texts):
    toks = []
    for text in texts:
        if text == '\n':
            toks.append((NEWLINE, text))
        elif text in kOpText2Number:
            toks.append((kOpText2Number[text], text))
        elif text.isdigit():
            toks.append((NUMBER, text))
        else:
            toks.append((NAME, text))
    return toks

kTryPrefix = _Synthetic(['try', ':', 'pass', '\n'])
kElsePrefix = _Synthetic(['if', '0', ':', 'pass', '\n'])
kTrySuffix = _Synthetic(['\n', 'finally', ':', 'pass'])
kDecoratorSuffix = _Synthetic(['\n', 'def', 'function', '(', ')', ':', 'pass'])


def CompleteLine(toks):
    """The (type, text) tokens fed for one logical line's tokens."""
    out = []
    decorator = False
    for i, (typ, text) in enumerate(toks):
        if i == 0 and typ == NAME:
            if text == 'elif':
                text = 'if'
            elif text in ('except', 'finally'):
                out.extend(kTryPrefix)
            elif text == 'else':
                out.extend(kElsePrefix)
        elif i == 0 and typ == AT:
            decorator = True
        out.append((typ, text))
    last_type = toks[-1][0] if toks else -1
    if toks and toks[0] == (NAME, 'try'):
        if last_type == COLON:
            out.append((NAME, 'pass'))
        out.extend(kTrySuffix)
    elif decorator:
        out.extend(kDecoratorSuffix)
    elif last_type == COLON:
        out.append((NAME, 'pass'))
    out.append((NEWLINE, '\n'))
    out.append((ENDMARKER, None))
    return out


class _Tree(tuple):
    """A parse-tree node: (type, value, context, children)."""


def ParseLine(grammar, toks):
    """Parses one logical line's tokens; returns the tree of _Tree nodes.

    Raises lib2to3's ParseError when the grammar rejects the line.
    """
    parser = pgen_parse.Parser(grammar, lambda g, node: _Tree(node))
    parser.setup()
    for i, (typ, text) in enumerate(CompleteLine(toks)):
        if parser.addtoken(typ, text, i):
            break
    else:
        raise pgen_parse.ParseError('incomplete input', ENDMARKER, None, None)
    return parser.rootnode


def TreeHas(grammar, tree, predicate):
    stack = [tree]
    while stack:
        node = stack.pop()
        if predicate(grammar, node):
            return True
        stack.extend(node[3] or ())
    return False


def Uses36Only(grammar, node):
    """True for a construct the 3.6 grammar adds to 3.5's."""
    name = grammar.number2symbol.get(node[0])
    children = node[3] or ()
    if name == 'annassign':
        return True
    if name == 'comp_for' and children[0][0] == ASYNC:
        return True
    # A comma after **kwargs, or after the keyword-only parameters.
    if name in ('typedargslist', 'varargslist') and children[-1][1] == ',':
        return any(c[1] in ('*', '**') for c in children)
    return False


# -- Logical lines of source files -----------------------------------------

class SourceFile(object):
    """The logical lines of one file, and what the interpreter thinks of it.

    lines: list of (first_row, last_row, [(type, text), ...]);
    error_row: the row of the parser's syntax error, None when the file is
    accepted, 0 when it is rejected before parsing (its encoding); token_error: why tokenizing failed, or None.
    """

    def __init__(self, path, lines, error_row, token_error):
        self.path = path
        self.lines = lines
        self.error_row = error_row
        self.token_error = token_error


def _OpOrError(text):
    return kOpText2Number.get(text, kErrorToken)


def SourceFile27(path):
    """Tokenizes a file with this interpreter (2.7); the parser is the oracle."""
    import parser as cparser
    source = support.ReadBytes(path)
    if source.startswith(codecs.BOM_UTF8):
        source = source[len(codecs.BOM_UTF8):]
    error_row = None
    try:
        compile(source, path, 'exec', 0, True)
    except SyntaxError:
        try:
            cparser.suite(source)
        except SyntaxError as e:
            error_row = e.lineno or 0
    except (TypeError, ValueError) as e:   # NUL bytes
        error_row = 0
    lines, cur, first = [], [], None
    token_error = None
    readline = iter(source.splitlines(True)).next
    kinds = {tokenize.NAME: NAME, tokenize.NUMBER: NUMBER,
             tokenize.STRING: STRING}
    try:
        for typ, text, (row, _), _, _ in tokenize.generate_tokens(readline):
            if typ == tokenize.NEWLINE:
                lines.append((first, row, cur))
                cur, first = [], None
                continue
            if typ in (tokenize.NL, tokenize.COMMENT, tokenize.INDENT,
                       tokenize.DEDENT, tokenize.ENDMARKER):
                continue
            if first is None:
                first = row
            if typ == tokenize.OP:
                cur.append((_OpOrError(text), text))
            else:
                cur.append((kinds.get(typ, kErrorToken), text))
    except (tokenize.TokenError, IndentationError, StopIteration) as e:
        token_error = str(e)
    if cur:
        lines.append((first, first, cur))
    return SourceFile(path, lines, error_row, token_error)


# Runs under 3.6: reads a JSON list of paths on stdin, writes one JSON object
# per file: {"path", "lines": [[first_row, last_row, [[type, text], ...]]],
# "error_row", "token_error"}.
k36Script = r'''
import json, parser, sys, token, tokenize
def main():
    out = []
    for path in json.load(sys.stdin):
        with open(path, 'rb') as f:
            source = f.read()
        error_row = None
        try:
            compile(source, path, 'exec', 0, True)
        except SyntaxError:
            try:
                enc = tokenize.detect_encoding(iter(source.splitlines(True)).__next__)[0]
                parser.suite(source.decode(enc))
            except SyntaxError as e:
                error_row = e.lineno or 0
            except Exception:
                error_row = 0
        except ValueError:
            error_row = 0
        lines, cur, first, token_error, prev_end = [], [], None, None, None
        skip = (tokenize.NL, tokenize.COMMENT, tokenize.INDENT, tokenize.DEDENT,
                tokenize.ENDMARKER, tokenize.ENCODING)
        try:
            for t in tokenize.tokenize(iter(source.splitlines(True)).__next__):
                if t.type == tokenize.NEWLINE:
                    lines.append([first, t.start[0], cur])
                    cur, first = [], None
                elif t.type not in skip:
                    if first is None:
                        first = t.start[0]
                    # Non-ASCII characters continue a name (as the host's
                    # tokenizer has it), even those tokenize does not know.
                    if (t.type == tokenize.ERRORTOKEN and cur and
                            cur[-1][0] == 'NAME' and prev_end == t.start and
                            min(t.string) >= '\x80'):
                        cur[-1][1] += t.string
                    else:
                        cur.append([token.tok_name[t.type], t.string])
                    prev_end = t.end
        except (tokenize.TokenError, SyntaxError, UnicodeDecodeError) as e:
            token_error = str(e)
        if cur:
            lines.append([first, first, cur])
        out.append({"path": path, "lines": lines, "error_row": error_row,
                    "token_error": token_error})
    json.dump(out, sys.stdout)
main()
'''

k36Types = {'NAME': NAME, 'NUMBER': NUMBER, 'STRING': STRING,
            'ASYNC': ASYNC, 'AWAIT': AWAIT}


def SourceFiles36(paths):
    """Yields the SourceFile of each path, tokenized by 3.6 in batches."""
    for start in range(0, len(paths), 100):
        batch = paths[start:start + 100]
        out = support.RunOracle('3.6', k36Script, json.dumps(batch))
        for item in json.loads(out):
            lines = []
            for first, last, toks in item['lines']:
                conv = []
                for name, text in toks:
                    text = text.encode('utf-8')
                    if name == 'OP':
                        conv.append((_OpOrError(text), text))
                    else:
                        conv.append((k36Types.get(name, kErrorToken), text))
                lines.append((first, last, conv))
            yield SourceFile(item['path'].encode('utf-8'), lines,
                             item['error_row'], item['token_error'])


def _UsesPrintFunction(source_file):
    for _, _, toks in source_file.lines:
        texts = [t for _, t in toks]
        if texts[:3] == ['from', '__future__', 'import'] and 'print_function' in texts:
            return True
    return False


# -- Corpus check ----------------------------------------------------------

class CorpusCounts(object):
    def __init__(self):
        self.files = 0
        self.lines = 0
        self.parsed = 0
        self.accepted_files = 0
        self.rejected_files = 0
        self.rejected_caught = 0
        self.only36 = 0
        self.print_function_files = 0
        self.token_errors = 0
        self.undecodable = 0
        self.mutants = 0
        self.mutants_valid = 0
        self.failures = []   # (path, row, reason) of unexpected results

    def Report(self, label):
        return ('%s: %d files (%d accepted, %d rejected by the parser, '
                '%d of those caught, %d rejected for their encoding, '
                '%d untokenizable, %d with print_function), '
                '%d logical lines, %d parsed, %d 3.6-only; %d mutated lines, '
                '%d of them valid; %d unexpected'
                % (label, self.files, self.accepted_files, self.rejected_files,
                   self.rejected_caught, self.undecodable, self.token_errors,
                   self.print_function_files, self.lines, self.parsed,
                   self.only36, self.mutants, self.mutants_valid,
                   len(self.failures)))


def CheckFile(source_file, grammar, counts, grammar36=None):
    """Parses every logical line of a file; updates counts.

    With grammar36 (checking the 3.5 grammar against a 3.6 corpus), a line that
    fails under grammar but parses under grammar36 must use a 3.6 construct.
    """
    counts.files += 1
    if source_file.token_error is not None:
        counts.token_errors += 1
        if source_file.error_row is None:
            counts.failures.append((source_file.path, 0, 'tokenize: '
                                    + source_file.token_error))
        return
    if 'print' in grammar.keywords and _UsesPrintFunction(source_file):
        counts.print_function_files += 1
        grammar = PrintFunctionGrammar(grammar)
    error_row = source_file.error_row
    if error_row == 0:
        counts.undecodable += 1
        return
    if error_row is None:
        counts.accepted_files += 1
    else:
        counts.rejected_files += 1
    caught = False
    for first, last, toks in source_file.lines:
        if error_row is not None and first > error_row:
            break
        counts.lines += 1
        try:
            ParseLine(grammar, toks)
            counts.parsed += 1
            ok = True
        except pgen_parse.ParseError as e:
            ok = False
            err = e
        at_error = error_row is not None and first <= error_row <= last
        if at_error:
            caught = caught or not ok
            continue
        if ok:
            continue
        if grammar36 is not None:
            try:
                tree = ParseLine(grammar36, toks)
            except pgen_parse.ParseError:
                tree = None
            if tree is not None and TreeHas(grammar36, tree, Uses36Only):
                counts.only36 += 1
                continue
        counts.failures.append((source_file.path, first, '%s: %s' % (
            err.msg, ' '.join(t for _, t in toks)[:200])))
    if error_row is not None:
        if caught:
            counts.rejected_caught += 1
        else:
            counts.failures.append((source_file.path, error_row,
                                    'rejected line parsed'))


# -- Mutated lines against the interpreter's parser ------------------------

def _Pool(version):
    texts = ['if', 'else', 'lambda', 'for', 'in', 'not', 'is', 'as', 'import',
             'from', 'yield', 'return', 'del', 'print', 'None', 'x', '1', '"s"',
             '(', ')', '[', ']', '{', '}', ':', ',', '=', '*', '**', '.', '@',
             '-', ';', '+=', '`']
    if version != '2.7':
        texts += ['...', 'nonlocal', '->', '@=']
    toks = []
    for text in texts:
        if text[0].isalpha():
            toks.append((NAME, text))
        elif text.isdigit():
            toks.append((NUMBER, text))
        elif text[0] == '"':
            toks.append((STRING, text))
        else:
            toks.append((kOpText2Number[text], text))
    return toks


def Mutate(toks, rnd, pool):
    """One random edit of a token list: drop, repeat, swap or insert."""
    toks = list(toks)
    i = rnd.randrange(len(toks))
    how = rnd.randrange(4)
    if how == 0:
        del toks[i]
    elif how == 1:
        toks.insert(i, toks[i])
    elif how == 2 and i + 1 < len(toks):
        toks[i], toks[i + 1] = toks[i + 1], toks[i]
    else:
        toks.insert(i, rnd.choice(pool))
    return toks


def CompletedText(toks):
    """Source text of a completed line: tokens joined by blanks."""
    return ' '.join(t for _, t in CompleteLine(toks)[:-1]).replace(' \n ', '\n')


def _Mutants(source_files, version, per_file, seed=99):
    """(mutated tokens) for up to per_file lines of each accepted file."""
    import random
    rnd = random.Random(seed)
    pool = _Pool(version)
    mutants = []
    for source_file in source_files:
        if (source_file.error_row is not None or source_file.token_error
                or (version == '2.7' and _UsesPrintFunction(source_file))):
            continue
        lines = [toks for _, _, toks in source_file.lines if toks]
        for toks in rnd.sample(lines, min(per_file, len(lines))):
            mutant = Mutate(toks, rnd, pool)
            texts = [t for _, t in mutant]
            # A token number shared by two texts ("<>" and "!=") makes lines
            # the interpreter tells apart look alike.
            if not mutant or 'async' in texts or 'await' in texts or (
                    version != '2.7' and '<>' in texts):
                continue
            mutants.append(mutant)
    return mutants


k36ParseScript = r'''
import json, parser, sys
out = []
for text in json.load(sys.stdin):
    try:
        parser.suite(text)
        out.append(True)
    except SyntaxError:
        out.append(False)
json.dump(out, sys.stdout)
'''


def _Verdicts27(texts):
    import parser as cparser
    out = []
    for text in texts:
        try:
            cparser.suite(text)
            out.append(True)
        except SyntaxError:
            out.append(False)
    return out


def _Verdicts36(texts):
    return json.loads(support.RunOracle('3.6', k36ParseScript, json.dumps(
        [t.decode('utf-8') for t in texts])))


def CheckMutants(mutants, verdicts, grammar, counts, grammar36=None):
    """The grammar must agree with the interpreter's parser on each mutant.

    With grammar36 (the 3.5 grammar against the 3.6 parser): a mutant 3.6
    accepts must parse unless it uses a 3.6 construct; one it rejects must not.
    """
    for mutant, valid in zip(mutants, verdicts):
        counts.mutants += 1
        counts.mutants_valid += valid
        ok = _Parses(grammar, mutant)
        if ok == valid:
            continue
        if grammar36 is not None and valid:
            tree = ParseLine(grammar36, mutant)
            if TreeHas(grammar36, tree, Uses36Only):
                continue
        counts.failures.append(('mutant', int(valid), CompletedText(mutant)))


def CheckCorpus27(paths, mutants_per_file=20):
    counts = CorpusCounts()
    grammar = LoadGrammar('2.7')
    files = [SourceFile27(path) for path in paths]
    for source_file in files:
        CheckFile(source_file, grammar, counts)
    mutants = _Mutants(files, '2.7', mutants_per_file)
    CheckMutants(mutants, _Verdicts27([CompletedText(m) for m in mutants]),
                 grammar, counts)
    return counts


def CheckCorpus36(paths, mutants_per_file=20):
    """Counts for the 3.5 and the 3.6 grammars over the same 3.6 files."""
    c35, c36 = CorpusCounts(), CorpusCounts()
    g35, g36 = LoadGrammar('3.5'), LoadGrammar('3.6')
    files = []
    for source_file in SourceFiles36(paths):
        CheckFile(source_file, g36, c36)
        CheckFile(source_file, g35, c35, grammar36=g36)
        files.append(source_file)
    mutants = _Mutants(files, '3.6', mutants_per_file)
    verdicts = _Verdicts36([CompletedText(m) for m in mutants])
    CheckMutants(mutants, verdicts, g36, c36)
    CheckMutants(mutants, verdicts, g35, c35, grammar36=g36)
    return c35, c36


def _Sample(version):
    limit = None if os.environ.get('TREELENS_CORPUS_LIMIT') else 120
    return support.CorpusFiles(version, limit=limit)


def _Failures(counts):
    return '\n'.join('%s:%s: %s' % f for f in counts.failures[:20])


# -- Tests -----------------------------------------------------------------

# Rule texts the analyzer's node classes name, by the versions that have them.
kBinaryRules = [
    "test: or_test ['if' or_test 'else' test] | lambdef",
    "or_test: and_test ('or' and_test)*",
    "and_test: not_test ('and' not_test)*",
    "not_test: 'not' not_test | comparison",
    "comparison: expr (comp_op expr)*",
    "expr: xor_expr ('|' xor_expr)*",
    "xor_expr: and_expr ('^' and_expr)*",
    "and_expr: shift_expr ('&' shift_expr)*",
    "shift_expr: arith_expr (('<<'|'>>') arith_expr)*",
    "arith_expr: term (('+'|'-') term)*",
]
kCommonRules = kBinaryRules + [
    "decorator: '@' dotted_name [ '(' [arglist] ')' ] NEWLINE",
    "dotted_name: NAME ('.' NAME)*",
    "decorators: decorator+",
    "testlist: test (',' test)* [',']",
]
kRules27 = kCommonRules + [
    "term: factor (('*'|'/'|'%'|'//') factor)*",
    "fpdef: NAME | '(' fplist ')'",
    "fplist: fpdef (',' fpdef)* [',']",
    "except_clause: 'except' [test [('as' | ',') test]]",
    "yield_expr: 'yield' [testlist]",
    "exprlist: expr (',' expr)* [',']",
    "testlist_comp: test ( comp_for | (',' test)* [','] )",
    "listmaker: test ( list_for | (',' test)* [','] )",
    "power: atom trailer* ['**' factor]",
]
kRules35 = kCommonRules + [
    "star_expr: '*' expr",
    "tfpdef: NAME [':' test]",
    "except_clause: 'except' [test ['as' NAME]]",
    "yield_expr: 'yield' [yield_arg]",
    "yield_arg: 'from' test | testlist",
    "testlist_star_expr: (test|star_expr) (',' (test|star_expr))* [',']",
    "atom_expr: [AWAIT] atom trailer*",
    "power: atom_expr ['**' factor]",
]
kRulesByVersion = {
    '2.7': kRules27,
    '3.5': kRules35,
    '3.6': kRules35 + ["annassign: ':' test ['=' test]"],
}
kRulesByVersion['3.7'] = kRulesByVersion['3.6']
kRulesByVersion['3.8'] = [r for r in kRules35 if not r.startswith('yield_arg')] + [
    "yield_arg: 'from' test | testlist_star_expr",
    "annassign: ':' test ['=' (yield_expr|testlist_star_expr)]",
    "namedexpr_test: test [':=' test]",
    "testlist_comp: (namedexpr_test|star_expr) ( comp_for | (',' (namedexpr_test|star_expr))* [','] )",
]

# 3.9: any expression after '@'; 3.10: case clauses and patterns; 3.11: except* and the
# starred annotation of '*args'; 3.12: type parameters and the type statement.
kRulesByVersion['3.9'] = [r for r in kRulesByVersion['3.8'] if not r.startswith('decorator:')]
kRulesByVersion['3.10'] = kRulesByVersion['3.9'] + [
    "case_block: CASE patterns [guard] ':' suite",
    "pattern: or_pattern ['as' NAME]",
    "name_pattern: NAME ('.' NAME)* ['(' [class_arg (',' class_arg)* [',']] ')']",
    "mapping_item: (literal_pattern | value_name) ':' pattern | '**' NAME",
]
kRulesByVersion['3.11'] = [r for r in kRulesByVersion['3.10'] if not r.startswith('except_clause:')] + [
    "tfpdef_star: NAME [':' (test | star_expr)]",
]
kRulesByVersion['3.12'] = kRulesByVersion['3.11'] + [
    "type_params: '[' type_param (',' type_param)* [','] ']'",
    "type_stmt: TYPE NAME [type_params] '=' test",
]
kRulesByVersion['3.13'] = kRulesByVersion['3.12']

kCommonStates = ['with_stmt', 'with_item', 'pass_stmt', 'expr_stmt',
                 'return_stmt', 'power', 'trailer', 'atom', 'funcdef',
                 'global_stmt', 'lambdef', 'parameters', 'varargslist',
                 'arglist', 'argument', 'classdef', 'for_stmt', 'import_name',
                 'import_from', 'comp_for', 'factor', 'file_input',
                 'decorated', 'try_stmt', 'if_stmt', 'while_stmt',
                 'subscript', 'dictorsetmaker', 'comp_op', 'augassign']
kStatesByVersion = {
    '2.7': kCommonStates + ['list_for', 'print_stmt', 'exec_stmt',
                            'old_lambdef', 'testlist_safe', 'fplist'],
    '3.5': kCommonStates + ['nonlocal_stmt', 'lambdef_nocond',
                            'typedargslist', 'async_stmt', 'async_funcdef',
                            'atom_expr', 'star_expr', 'yield_arg'],
}
kStatesByVersion['3.6'] = kStatesByVersion['3.5'] + ['annassign']
kStatesByVersion['3.7'] = kStatesByVersion['3.6']
kStatesByVersion['3.8'] = kStatesByVersion['3.6'] + ['namedexpr_test']
kStatesByVersion['3.9'] = kStatesByVersion['3.8']
kStatesByVersion['3.10'] = kStatesByVersion['3.9'] + ['match_stmt', 'case_block', 'guard', 'patterns']
kStatesByVersion['3.11'] = kStatesByVersion['3.10'] + ['tfpdef_star']
kStatesByVersion['3.12'] = kStatesByVersion['3.11'] + ['type_params', 'type_param', 'type_stmt']
kStatesByVersion['3.13'] = kStatesByVersion['3.12']
kAbsentByVersion = {
    '2.7': ['atom_expr', 'nonlocal_stmt', 'star_expr', 'annassign',
            'async_stmt', 'typedargslist', 'namedexpr_test'],
    '3.5': ['print_stmt', 'exec_stmt', 'list_for', 'fplist', 'annassign', 'namedexpr_test'],
    '3.6': ['print_stmt', 'exec_stmt', 'list_for', 'fplist', 'namedexpr_test'],
    '3.7': ['print_stmt', 'exec_stmt', 'list_for', 'fplist', 'namedexpr_test'],
    '3.8': ['print_stmt', 'exec_stmt', 'list_for', 'fplist'],
    '3.9': ['print_stmt', 'exec_stmt', 'list_for', 'fplist', 'match_stmt'],
    '3.10': ['print_stmt', 'exec_stmt', 'list_for', 'fplist', 'tfpdef_star'],
    '3.11': ['print_stmt', 'exec_stmt', 'list_for', 'fplist', 'type_params'],
    '3.12': ['print_stmt', 'exec_stmt', 'list_for', 'fplist'],
    '3.13': ['print_stmt', 'exec_stmt', 'list_for', 'fplist'],
}

# Single logical lines (source text) and the versions whose grammar accepts them.
kNewer = ('3.9', '3.10', '3.11', '3.12', '3.13')
kAll = ('2.7', '3.5', '3.6', '3.7', '3.8') + kNewer
kPy3 = ('3.5', '3.6', '3.7', '3.8') + kNewer
kPy36 = ('3.6', '3.7', '3.8') + kNewer
kPy38On = ('3.8',) + kNewer
kSnippets = [
    ('x = 1', kAll),
    ('a, b = b, a', kAll),
    ('x += f(a, *b, **c)', kAll),
    ('print x', ('2.7',)),
    ('print >>sys.stderr, x,', kAll),
    ('print >>sys.stderr', kAll),
    ('print x, y', ('2.7',)),
    ('print(x, file=f)', kPy3),
    ('exec code in ns', ('2.7',)),
    ('x = `y`', ('2.7',)),
    # "<>" and "!=" share one token number: no grammar can tell them apart.
    # "->" and "@=" have a number each.
    ('if a <> b: pass', kAll),
    ('x -> y', ()),
    ('lambda: x -> y', ()),
    ('def f() @= int: pass', ()),
    ('x @= y', kPy3),
    ('x.y[0] @= f(z)', kPy3),
    ('def f() -> int: pass', kPy3),
    ('if a != b: pass', kAll),
    ('def f((a, b), c=1): pass', ('2.7',)),
    ('def f(a, (b, c)=(1, 2), *args, **kw): pass', ('2.7',)),
    ('def f(a: int, *, b: str = "") -> bool:', kPy3),
    ('def f(a, *, b): pass', kPy3),
    ('def f(**kw,): pass', kPy36),
    ('def f(a, *, b,): pass', kPy36),
    ('lambda a, *b, **c: 0', kAll),
    ('lambda *, k: k', kPy3),
    ('except ValueError, e:', ('2.7',)),
    ('except ValueError as e:', kAll),
    ('except (A, B) as e.x:', ('2.7',)),
    ('raise E, "msg", tb', ('2.7',)),
    ('raise E from e', kPy3),
    ('x = yield', kAll),
    ('x = yield from g()', kPy3),
    ('nonlocal a, b', kPy3),
    ('global a, b', kAll),
    ('a, *b = c', kPy3),
    ('x = a @ b', kPy3),
    ('x @= b', kPy3),
    ('x = y[...]', kAll),
    ('x = ...', kPy3),
    ('from ... import x', kAll),
    ('from .. import x', kAll),
    ('from .a.b import (c as d, e,)', kAll),
    ('import a.b as c, d', kAll),
    ('x: int = 1', kPy36),
    ('self.x: List[int]', kPy36),
    ('x = [i for i in a if i]', kAll),
    ('x = [i for i in a, b]', ('2.7',)),
    ('x = [i for i in lambda: 1 if 0 else 2]', ()),
    ('x = {k: v for k, v in d}', kAll),
    ('x = {a, b}', kAll),
    ('x = {**a, "b": 1}', kPy3),
    ('x = [*a, *b]', kPy3),
    ('f(*a, *b, **c, **d)', kPy3),
    ('f(x for x in y)', kAll),
    ('f(a=1, *b)', kAll),
    ('x = a if b else lambda: c', kAll),
    ('with a as b, c as d:', kAll),
    ('class A(B, metaclass=M):', kPy3),
    ('class A(B, C): pass', kAll),
    ('class A():', kAll),
    ('@property', kAll),
    ('@a.b(c, d=1)', kAll),
    ('@a[0]', kNewer),
    ('elif x:', kAll),
    ('else:', kAll),
    ('finally:', kAll),
    ('try:', kAll),
    ('for x, in y: pass', kAll),
    ('while 1: break', kAll),
    ('assert x, "msg"', kAll),
    ('del a[0], b.c', kAll),
    ('a = b = c', kAll),
    ('x = not a in b is not c', kAll),
    ('x = a[1:2, ::3]', kAll),
    ('x = -a ** -b', kAll),
    ('x = 1 +', ()),
    ('x = (', ()),
    ('def f(): return', kAll),
    ('return x, y', kAll),
    ('x = None', kAll),
    ('None = 1', kAll),
    ('def None(): pass', ('2.7',)),
    ('import', ()),
    ('x = = 1', ()),
    ('f(**a, *b)', kPy3),
    ('f(**a, b)', kPy3),
    ('f(a for a in b, c)', kAll),
    ('x = a $ b', ()),
    # 3.8: assignment expressions where CPython 3.8's grammar has them, positional-only
    # parameters, starred values after return, yield and an annotated assignment's '='.
    ('if (n := len(a)) > 10: pass', kPy38On),
    ('if x := f(): pass', kPy38On),
    ('elif x := f(): pass', kPy38On),
    ('while chunk := read(): pass', kPy38On),
    ('x = [y := f(x), y ** 2]', kPy38On),
    ('x = [y for x in d if (y := f(x))]', kPy38On),
    ('x = [y := 1 for x in d]', kPy38On),
    ('f(x := 1, y=2)', kPy38On),
    ('x := 1', ()),
    ('x = y := 1', ()),
    ('x = [y for x in d if y := f(x)]', ()),
    ('x = {y := 1}', kNewer),
    ('x = a[y := 1]', kNewer[1:]),
    ('f(x := 1 for x in y)', ()),
    ('f(a=b := 1)', ()),
    ('def f(a, b=1, /, c=2, *, d): pass', kPy38On),
    ('def f(a: int, /): pass', kPy38On),
    ('def f(a, /,): pass', kPy38On),
    ('lambda a, /, b: a', kPy38On),
    ('def f(/, a): pass', ()),
    ('def f(a, /, /): pass', ()),
    ('def f(*a, /): pass', ()),
    ('return *a, b', kPy38On),
    ('x = yield *a, b', kPy38On),
    ('x: T = 1, 2', kPy38On),
    ('x: T = yield', kPy38On),
    # 3.9: starred items after 'for ... in'; 3.11: starred subscripts.
    ('for x in *a, *b: pass', kNewer),
    ('x = a[*b, c]', kNewer[2:]),
    ('return *a', kPy38On),  # as in CPython 3.8's grammar; its compiler rejects the lone star
]
# Snippets whose `async`/`await` are keyword tokens: (text, versions).
kAsyncSnippets = [
    ('ASYNC def f(): AWAIT x', kPy3),
    ('ASYNC for a in b:', kPy3),
    ('ASYNC with a as b:', kPy3),
    ('x = AWAIT f() ** 2', kPy3),
    ('x = [i ASYNC for i in a]', kPy36),
    ('x = [AWAIT i ASYNC for i in a if (j := i)]', kPy38On),
    ('x = AWAIT', ()),
    ('ASYNC x = 1', ()),
    ('ASYNC class A:', ()),
]


kSnippetOps = sorted(kOpText2Number, key=len, reverse=True)
kSnippetToken = re.compile(
    r'\s*(?:([A-Za-z_]\w*)|(\d+)|("[^"]*"|\'[^\']*\')|(%s)|(\S))'
    % '|'.join(re.escape(op) for op in kSnippetOps))


def SnippetTokens(text, version):
    """(type, text) tokens of a one-line snippet as the analyzer feeds them.

    ASYNC and AWAIT stand for the keyword tokens; under 2.7, "..." is three
    "." tokens.
    """
    toks = []
    for m in kSnippetToken.finditer(text.rstrip()):
        name, number, string, op, other = m.groups()
        if name in ('ASYNC', 'AWAIT'):
            toks.append((ASYNC if name == 'ASYNC' else AWAIT, name.lower()))
        elif name:
            toks.append((NAME, name))
        elif number:
            toks.append((NUMBER, number))
        elif string:
            toks.append((STRING, string))
        elif op == '...' and version == '2.7':
            toks.extend([(23, '.')] * 3)
        elif op:
            toks.append((kOpText2Number[op], op))
        else:
            toks.append((kErrorToken, other))
    return toks


def _Parses(grammar, toks):
    if not isinstance(grammar, pgen_grammar.Grammar):
        grammar = LoadGrammar(grammar)
    try:
        ParseLine(grammar, toks)
        return True
    except pgen_parse.ParseError:
        return False


class GrammarFileTest(unittest.TestCase):

    def testFoundWhereTheAnalyzerLooks(self):
        from pysource import config
        for version in kVersions:
            path = config.GetLoomFilename(
                'resources/pgen-grammars/Python-Grammar-' + version)
            self.assertTrue(os.path.isfile(path), path)

    def testStartSymbolIsFileInput(self):
        for version in kVersions:
            g = LoadGrammar(version)
            self.assertEqual(g.number2symbol[g.start], 'file_input', version)

    def testNodeClassRulesAppearVerbatim(self):
        for version in kVersions:
            rules = RuleTexts(version)
            for rule in kRulesByVersion[version]:
                name = rule.split(':', 1)[0].strip()
                self.assertIn(Squeeze(rule), rules.get(name, []),
                              '%s: %s' % (version, rule))

    def testStateNames(self):
        for version in kVersions:
            symbols = LoadGrammar(version).symbol2number
            for name in kStatesByVersion[version]:
                self.assertIn(name, symbols, '%s: %s missing' % (version, name))
            for name in kAbsentByVersion[version]:
                self.assertNotIn(name, symbols, '%s: %s present' % (version, name))

    def testEveryRuleIsReachable(self):
        for version in kVersions:
            g = LoadGrammar(version)
            seen, stack = set(), [g.start]
            while stack:
                sym = stack.pop()
                if sym in seen:
                    continue
                seen.add(sym)
                for state in g.dfas[sym][0]:
                    for label, _ in state:
                        if g.labels[label][0] >= 256:
                            stack.append(g.labels[label][0])
            unreachable = set(g.number2symbol) - seen
            self.assertEqual(set(), unreachable, version)

    def testKeywordsAndTokens(self):
        for version in kVersions:
            g = LoadGrammar(version)
            py2 = version == '2.7'
            for kw in ('print', 'exec'):
                self.assertEqual(py2, kw in g.keywords, '%s: %s' % (version, kw))
            for kw in ('nonlocal', 'None', 'True', 'False'):
                self.assertEqual(not py2, kw in g.keywords, '%s: %s' % (version, kw))
            for tok in (ASYNC, AWAIT, 51, 52):
                self.assertEqual(not py2, tok in g.tokens, '%s: %d' % (version, tok))

    def testSnippets(self):
        for text, versions in kSnippets + kAsyncSnippets:
            for version in kVersions:
                self.assertEqual(version in versions,
                                 _Parses(version, SnippetTokens(text, version)),
                                 '%s: %r' % (version, text))

    def testEllipsisAsThreeDotsIn27(self):
        dots = [(NAME, 'x'), (9, '[')] + [(23, '.')] * 3 + [(10, ']')]
        self.assertTrue(_Parses('2.7', dots))
        self.assertFalse(_Parses('2.7', [(NAME, 'x'), (9, '['), (52, '...'), (10, ']')]))

    def testErrorTokenNeverParses(self):
        for version in kVersions:
            self.assertFalse(_Parses(version, [(NAME, 'x'), (kErrorToken, '$')]),
                             version)

    def testTwoStatementsOnOneLine(self):
        for version in kVersions:
            tree = ParseLine(LoadGrammar(version),
                             SnippetTokens('a = 1; b = 2;', version))
            self.assertEqual(2, len(tree[3]), version)   # stmt, ENDMARKER


class GrammarCorpusTest(unittest.TestCase):
    """Every logical line of the standard libraries, sampled."""

    def testPython27Stdlib(self):
        paths = _Sample('2.7')
        counts = CheckCorpus27(paths)
        self.assertGreater(counts.parsed, 1000)
        self.assertEqual([], counts.failures, _Failures(counts))

    def testPython36Stdlib(self):
        if support.Interpreter('3.6') is None:
            self.skipTest('Python 3.6 not installed')
        c35, c36 = CheckCorpus36(_Sample('3.6'))
        self.assertGreater(c36.parsed, 1000)
        self.assertEqual([], c36.failures, _Failures(c36))
        self.assertEqual([], c35.failures, _Failures(c35))


def main():
    paths27 = support.CorpusFiles('2.7')
    counts = CheckCorpus27(paths27)
    print(counts.Report('2.7 grammar, 2.7 stdlib'))
    for f in counts.failures:
        print('  %s:%s: %s' % f)
    if support.Interpreter('3.6') is not None:
        c35, c36 = CheckCorpus36(support.CorpusFiles('3.6'))
        for label, c in (('3.5 grammar, 3.6 stdlib', c35),
                         ('3.6 grammar, 3.6 stdlib', c36)):
            print(c.Report(label))
            for f in c.failures:
                print('  %s:%s: %s' % f)


if __name__ == '__main__':
    if '--report' in sys.argv[1:]:
        main()
    else:
        unittest.main()
