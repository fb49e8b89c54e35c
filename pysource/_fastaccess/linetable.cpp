// A record's significant tokens with 1-based positions, its comments apart and
// its brackets matched, built in one pass for the name resolver.
#include "pysource/_fastaccess/linetable.h"

#include <vector>

namespace fastaccess {

using tl::Ref;
using tl::require;

namespace {

bool isText(PyObject *T, char C) {
  return T && PyString_GET_SIZE(T) == 1 && PyString_AS_STRING(T)[0] == C;
}

bool isComment(PyObject *T) {
  return T && PyString_GET_SIZE(T) > 0 && PyString_AS_STRING(T)[0] == '#';
}

/// 0 for no bracket, 1 for an opening one, -1 for a closing one.
int bracketOf(PyObject *T) {
  if (!T || PyString_GET_SIZE(T) != 1)
    return 0;
  switch (PyString_AS_STRING(T)[0]) {
  case '(':
  case '[':
  case '{':
    return 1;
  case ')':
  case ']':
  case '}':
    return -1;
  default:
    return 0;
  }
}

Ref newInt(long V) { return require(PyInt_FromLong(V)); }

} // namespace

Ref lineTable(PyObject *Logical) {
  LogicalLineObject *L = asLogical(Logical);
  const long First = L->FirstLine + 1;
  Ref Texts = require(PyList_New(0));
  Ref Lines = require(PyList_New(0));
  Ref Cols = require(PyList_New(0));
  Ref Comments = require(PyList_New(0));
  Ref Match = require(PyDict_New());
  std::vector<Py_ssize_t> Open;
  Py_ssize_t N = 0; // significant tokens so far
  for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
    PyObject *T = L->Texts[I];
    const TokenPos P = L->Positions[I];
    if (isComment(T)) {
      Ref Line = newInt(First + P.Row), Col = newInt(P.Col + 1);
      Ref Entry = require(PyTuple_Pack(3, Line.get(), Col.get(), T));
      tl::requireStatus(PyList_Append(Comments.get(), Entry.get()));
      continue;
    }
    if (isText(T, '\\'))
      continue; // a line continuation
    tl::requireStatus(PyList_Append(Texts.get(), T ? T : Py_None));
    tl::requireStatus(PyList_Append(Lines.get(), newInt(First + P.Row).get()));
    tl::requireStatus(PyList_Append(Cols.get(), newInt(P.Col + 1).get()));
    const int B = bracketOf(T);
    if (B > 0) {
      Open.push_back(N);
    } else if (B < 0 && !Open.empty()) {
      // A closing bracket closes the innermost open one, whatever its shape.
      Ref Key = newInt(static_cast<long>(Open.back())), Value = newInt(static_cast<long>(N));
      tl::requireStatus(PyDict_SetItem(Match.get(), Key.get(), Value.get()));
      Open.pop_back();
    }
    ++N;
  }
  // Brackets left open run to the end of the line.
  Ref End = newInt(static_cast<long>(N));
  for (Py_ssize_t At : Open)
    tl::requireStatus(PyDict_SetItem(Match.get(), newInt(static_cast<long>(At)).get(), End.get()));
  bool Ascii = true;
  if (L->LineText) {
    const char *S = PyString_AS_STRING(L->LineText);
    for (Py_ssize_t K = 0, Len = PyString_GET_SIZE(L->LineText); K < Len && Ascii; ++K)
      Ascii = static_cast<unsigned char>(S[K]) < 0x80;
  }
  return require(Py_BuildValue("(OOOOOO)", Texts.get(), Lines.get(), Cols.get(), Comments.get(),
                               Match.get(), Ascii ? Py_True : Py_False));
}

} // namespace fastaccess
