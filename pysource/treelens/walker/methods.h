// The Python method tables of the walker classes: each operation parses its object arguments and
// calls the native implementation with the walker.
#ifndef TREELENS_WALKER_METHODS_H
#define TREELENS_WALKER_METHODS_H

#include "override.h"

namespace treelens {
namespace walker {

/// Parses up to four object arguments (unused ones stay nullptr) and runs one
/// operation of a walker whose object layout is Object.
template <class Object>
PyObject *runOp(PyObject *Self, PyObject *Args, PyObject *Kwds, const char *Format, const char *const *Keywords,
                tl::Ref (*Run)(Object *, PyObject *const *)) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *A[4] = {nullptr, nullptr, nullptr, nullptr};
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, Format, const_cast<char **>(Keywords), &A[0], &A[1], &A[2], &A[3]))
      throw tl::PyErrSet();
    return Run(reinterpret_cast<Object *>(Self), A).release();
  });
}

/// The None an operation without a result returns.
inline tl::Ref opDone() { return tl::Ref::borrow(Py_None); }

} // namespace walker
} // namespace treelens

/// A null-terminated keyword list.
#define TL_KEYWORDS(...)                                                                                  \
  [] {                                                                                                    \
    static const char *const List[] = {__VA_ARGS__, nullptr};                                             \
    return List;                                                                                          \
  }()

/// A method-table entry: Expr runs with W (an OpObject, which the including
/// file names) and X, the parsed arguments, and returns a Ref.
#define TL_OP(PyName, Format, Keywords, Doc, Expr)                                                        \
  {PyName,                                                                                                \
   tl::kwFunction([](PyObject *S, PyObject *A, PyObject *Kw) -> PyObject * {                              \
     return ::treelens::walker::runOp<OpObject>(S, A, Kw, Format ":" PyName, Keywords,                    \
                                                [](OpObject *W, PyObject *const *X) -> tl::Ref { Expr; }); \
   }),                                                                                                    \
   METH_VARARGS | METH_KEYWORDS, Doc}

/// A visit operation taking one node.
#define TL_NODE_OP(PyName, Fn, Doc)                                                                       \
  TL_OP(PyName, "O", TL_KEYWORDS("node"), Doc, Fn(W, X[0]); return ::treelens::walker::opDone())

#endif
