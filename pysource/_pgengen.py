"""Grammar generation for pysource.optpgen.

Reads a grammar file in pgen notation and builds the grammar object that the
native parser compiles into its tables. It builds on lib2to3's generator and
replaces its two fixed tables with the caller's: token names are looked up in
``tok_number2name`` (reversed) and operator texts in ``op_text2number``.
"""

from lib2to3.pgen2 import grammar as _grammar
from lib2to3.pgen2 import pgen as _pgen
import token as _token


class ParserGenerator(_pgen.ParserGenerator):
    """ParserGenerator(grammar_file, tok_number2name=None, op_text2number=None)

    Without the keyword tables the standard token module's names and
    lib2to3's operator map are used.
    """

    def __init__(self, filename, tok_number2name=None, op_text2number=None,
                 stream=None):
        if tok_number2name is None:
            tok_number2name = dict(_token.tok_name)
        if op_text2number is None:
            op_text2number = dict(_grammar.opmap)
        self.tok_number2name = dict(tok_number2name)
        # A name given to several numbers (the caller's "RARROW" at 51 beside
        # the standard one) means the lowest of them.
        self.tok_name2number = {}
        for number, name in sorted(tok_number2name.items(), reverse=True):
            self.tok_name2number[name] = number
        self.op_text2number = dict(op_text2number)
        _pgen.ParserGenerator.__init__(self, filename, stream)

    def make_label(self, c, label):
        ilabel = len(c.labels)
        if label[0].isalpha():
            if label in c.symbol2number:
                # A symbol name (a non-terminal).
                if label in c.symbol2label:
                    return c.symbol2label[label]
                c.labels.append((c.symbol2number[label], None))
                c.symbol2label[label] = ilabel
                return ilabel
            # A named token (NAME, NUMBER, ASYNC, ...).
            itoken = self.tok_name2number.get(label)
            if not isinstance(itoken, (int, long)):
                raise ValueError("Unknown token name %r in grammar %s"
                                 % (label, self.filename))
            if itoken in c.tokens:
                return c.tokens[itoken]
            c.labels.append((itoken, None))
            c.tokens[itoken] = ilabel
            return ilabel
        if label[0] not in ('"', "'"):
            raise ValueError("Bad label %r in grammar %s" % (label, self.filename))
        value = eval(label)
        if value[0].isalpha():
            # A keyword.
            if value in c.keywords:
                return c.keywords[value]
            c.labels.append((self.tok_name2number.get('NAME', 1), value))
            c.keywords[value] = ilabel
            return ilabel
        # An operator.
        itoken = self.op_text2number.get(value)
        if itoken is None:
            raise ValueError("Unknown operator %r in grammar %s"
                             % (value, self.filename))
        if itoken in c.tokens:
            return c.tokens[itoken]
        c.labels.append((itoken, None))
        c.tokens[itoken] = ilabel
        return ilabel
