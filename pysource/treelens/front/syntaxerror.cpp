// CreateSyntaxError: the language's SyntaxError for a token of a logical line.
#include "pysource/treelens/front/front.h"

#include "pysource/treelens/host/host.h"

namespace treelens {

using host::Host;
using tl::Ref;

Ref createSyntaxError(PyObject *Msg, PyObject *Logical, Py_ssize_t TokI) {
  auto *L = host::requireLogicalArg(Logical, "logical");
  Py_ssize_t Count = L->TokenCount;
  long Row, Col;
  if (TokI < Count) {
    // A real token (negative indices count from the end, as on fTokens).
    Py_ssize_t I = TokI < 0 ? TokI + Count : TokI;
    if (I < 0)
      tl::raise(PyExc_IndexError, "tuple index out of range");
    Row = L->Positions[I].Row;
    Col = L->Positions[I].Col;
  } else {
    // A synthetic completion token: just past the end of the last real token.
    if (Count == 0)
      tl::raise(PyExc_IndexError, "tuple index out of range");
    PyObject *Last = L->Texts[Count - 1];
    Row = L->Positions[Count - 1].Row;
    Col = L->Positions[Count - 1].Col + (Last && PyString_Check(Last) ? PyString_GET_SIZE(Last) : 0);
  }
  Ref Text = tl::require(PyObject_CallMethod(Host.LogicalInspect, const_cast<char *>("TextFromTokens"),
                                             const_cast<char *>("(O)"), Logical));
  return tl::require(PyObject_CallFunction(PyExc_SyntaxError, const_cast<char *>("(O(sllO))"), Msg,
                                           "<string>", Row + 1, Col + 1, Text.get()));
}

namespace {

PyObject *front_CreateSyntaxError(PyObject *, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"msg", "logical", "tok_i", nullptr};
    PyObject *Msg, *Logical;
    Py_ssize_t TokI;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OOn:CreateSyntaxError", const_cast<char **>(Keywords), &Msg,
                                     &Logical, &TokI))
      throw tl::PyErrSet();
    return createSyntaxError(Msg, Logical, TokI).release();
  });
}

} // namespace

PyMethodDef SyntaxErrorFunctions[] = {
    {"CreateSyntaxError", tl::kwFunction(front_CreateSyntaxError), METH_VARARGS | METH_KEYWORDS,
     "CreateSyntaxError(msg, logical, tok_i) -> SyntaxError located at token tok_i of the logical"},
    {nullptr, nullptr, 0, nullptr}};

} // namespace treelens
