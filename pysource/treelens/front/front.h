// The analysis front door: the analyzer types and syntax-error objects.
#ifndef TREELENS_FRONT_FRONT_H
#define TREELENS_FRONT_FRONT_H

#include "pysource/treelens/parse/parse.h"

namespace treelens {

/// CPGenAnalyzerImpl; final. Fields in declaration order.
struct AnalyzerObject {
  optpgen::NodeConverterObject Base;
  ParserObject *LogicalParser;
  PyObject *GetTime;
  PyObject *NodeWalker;     ///< CNodeWalker
  PyObject *TypeHintWalker; ///< CTypeHintWalker
  PyObject *FStringSupport; ///< CFStringSupport
  bool SyntaxChecks;        ///< also make CPython's checks after parsing (checks::checkLine)
  /// Unexpected failures reported and swallowed so far, and the repr of the
  /// last one's exception (a str, or null): a caller that gets None back can
  /// tell a failure from a clean line.
  Py_ssize_t Failures;
  PyObject *LastFailure;
};

/// CPGenAnalyzer, the abstract analyzer (base of CPGenParserImpl too).
TL_HIDDEN PyTypeObject &analyzerBaseType();
TL_HIDDEN PyTypeObject &analyzerType();

/// Readies CPGenAnalyzer; -1 on failure.
TL_HIDDEN int initAnalyzerBaseType(PyObject *Module);
/// Readies CPGenAnalyzerImpl (after the walker types); -1 on failure.
TL_HIDDEN int initAnalyzerType(PyObject *Module);

/// AnalyzeSingleLogical: None, or the SyntaxError describing why the logical
/// does not parse. New reference.
TL_HIDDEN tl::Ref analyzeSingleLogical(AnalyzerObject *A, PyObject *Logical, bool InAsyncDef);

/// _InspectSingleLogical: parses, walks and discards; raises SyntaxError,
/// ParseError, or ValueError wrapping any other failure of the walks.
TL_HIDDEN void inspectSingleLogical(AnalyzerObject *A, PyObject *Logical, bool InAsyncDef,
                                    bool InFString);

/// CreateSyntaxError(msg, logical, tok_i). New reference.
TL_HIDDEN tl::Ref createSyntaxError(PyObject *Msg, PyObject *Logical, Py_ssize_t TokI);

TL_HIDDEN extern PyMethodDef SyntaxErrorFunctions[];

} // namespace treelens

#endif
