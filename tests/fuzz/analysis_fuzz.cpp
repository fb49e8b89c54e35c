// libFuzzer target: the whole analysis of records built from the input, by an
// embedded interpreter that loads the native modules of this build. The
// first byte picks how: as source text split into logical lines, or as a
// record of tokens at arbitrary positions. Every line yields None or a
// SyntaxError; nothing else is raised or reported.
//
// Run from the repository root with TREELENS_BUILD_DIR set to the fuzz build.
#include <Python.h>

#include <cstdio>
#include <cstdlib>

namespace {

PyObject *AnalyzeInput = nullptr;

const char *const Harness = R"PY(
import logging
from pysource import _fastaccess as fa
from pysource import treelens as tl
from pysource import utils
from loomutils import reflect

_reported = []
reflect.ReportCurrentException = lambda *a, **k: _reported.append(1)
logging.disable(logging.CRITICAL)
_analyzers = [tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False),
              tl.CPGenAnalyzerImpl((3, 6, 0)), tl.CPGenAnalyzerImpl((3, 7, 0), 'Python-Grammar-3.7'),
              tl.CPGenAnalyzerImpl((3, 8, 0), 'Python-Grammar-3.8'),
              tl.CPGenAnalyzerImpl((3, 10, 0), 'Python-Grammar-3.10', syntax_checks=True),
              tl.CPGenAnalyzerImpl((3, 13, 0), 'Python-Grammar-3.13', syntax_checks=True)]

def _Check(result):
    assert result is None or isinstance(result, SyntaxError), repr(result)
    assert not _reported

def _Records(data):
    """Tokens separated by NUL bytes; a token's first two bytes move its row and column."""
    tokens, row, col = [], 0, 0
    for chunk in data.split(b'\0')[:64]:
        if len(chunk) < 3:
            continue
        drow, dcol = ord(chunk[0]) % 5 - 1, ord(chunk[1])
        if ord(chunk[0]) & 0x80:
            drow *= 1 << 28
        row = max(-2 ** 31, min(2 ** 31 - 1, row + drow))
        col = min(2 ** 31 - 1, col + dcol) if drow == 0 else dcol
        tokens.append((chunk[2:], (row, col)))
    return [fa.CLogicalLine(tokens, line_text=data[:200])]

def AnalyzeInput(data):
    mode, data = (ord(data[0]) if data else 0) % 2, data[1:]
    for analyzer in _analyzers:
        records = utils.GetLogicalsFromText(data)[:50] if mode == 0 else _Records(data)
        for record in records:
            _Check(analyzer.AnalyzeSingleLogical(record, False))
)PY";

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
  Py_NoSiteFlag = 1;
  Py_Initialize();
  PyRun_SimpleString("import sys; sys.path.insert(0, '.')");
  PyObject *Main = PyImport_AddModule("__main__");
  PyObject *Globals = PyModule_GetDict(Main);
  PyObject *R = PyRun_String(Harness, Py_file_input, Globals, Globals);
  if (!R) {
    PyErr_Print();
    std::abort();
  }
  Py_DECREF(R);
  AnalyzeInput = PyDict_GetItemString(Globals, "AnalyzeInput");
  if (!AnalyzeInput)
    std::abort();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *Data, size_t Size) {
  PyObject *R = PyObject_CallFunction(AnalyzeInput, const_cast<char *>("s#"),
                                      reinterpret_cast<const char *>(Data), static_cast<Py_ssize_t>(Size));
  if (!R) {
    PyErr_Print();
    std::abort();
  }
  Py_DECREF(R);
  return 0;
}
