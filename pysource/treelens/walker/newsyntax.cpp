// The symbol walker's handlers for case clauses and their patterns, type parameter lists and the
// type statement.
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/walker/walkerimpl.h"

#include <string>

namespace treelens {
namespace walker {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

/// ":t:", the prefix of a type parameter's info (symbolinfo.kTypeParamPrefix).
PyObject *TypeParamPrefix() {
  static PyObject *Prefix = tl::internName(":t:");
  return Prefix;
}

bool isLeaf(NodeObject *N, const char *Text) { return !N->Children && leafIs(N, Text); }

/// A capture binds its name in the line's scope; the wildcard `_` binds nothing.
void bindCapture(NW *W, NodeObject *Name) {
  PyObject *Text = Name->Text;
  if (!Text || !PyString_Check(Text) || textIs(Text, "_"))
    return;
  Ref Keep = Ref::borrow(Text);
  tl::requireStatus(host::Host.Fast->AppendAttrib(W->Logical ? W->Logical : Py_None, Text));
}

/// Reads the dotted name of children [0, End] of N (NAME ('.' NAME)*), each
/// prefix as a dotted name is read elsewhere: `a`, `a.b`.
void readDotted(NW *W, NodeObject *N, Py_ssize_t End) {
  std::string Text;
  for (Py_ssize_t I = 0; I <= End; ++I) {
    PyObject *Piece = childAt(N, I)->Text;
    if (!Piece || !PyString_Check(Piece))
      tl::raise(PyExc_TypeError, "dotted name part has no text");
    Text.append(PyString_AS_STRING(Piece), PyString_GET_SIZE(Piece));
    if (I % 2 == 0)
      processLoadName(W, tl::require(PyString_FromStringAndSize(Text.data(), Text.size())).get());
  }
}

/// A sub-pattern: a lone NAME is a capture; a pattern node is visited (through
/// the walker, which counts it against its limits); literals read nothing.
void visitSubPattern(NW *W, NodeObject *N) {
  if (isNodeOf(obj(N), C::CNameLiteral))
    bindCapture(W, N);
  else if (isNodeOf(obj(N), C::CPattern))
    visitNode(W, obj(N));
}

} // namespace

// Captures, star patterns (`*rest`), mapping rests (`**kw`) and `as` names
// bind; value and class patterns read their dotted names; literals read nothing.
void visitPattern(NW *W, PyObject *Node) {
  if (isNodeOf(Node, C::CNameLiteral)) {
    bindCapture(W, node(Node));
    return;
  }
  NodeObject *N = node(Node);
  Py_ssize_t Count = rawCount(N);
  if (Count == 0)
    return;
  NodeObject *First = childAt(N, 0);
  if (Count == 2 && (isLeaf(First, "*") || isLeaf(First, "**"))) {
    bindCapture(W, childAt(N, 1));
    return;
  }
  if (Count == 3 && isLeaf(childAt(N, 1), "as")) {
    visitSubPattern(W, First);
    bindCapture(W, childAt(N, 2));
    return;
  }
  if (isNodeOf(obj(First), C::CNameLiteral) && Count >= 2 &&
      (isLeaf(childAt(N, 1), ".") || isLeaf(childAt(N, 1), "("))) {
    // A value pattern `a.b` or a class pattern `a.B(p, k=q)`.
    Py_ssize_t End = 0;
    while (End + 2 < Count && isLeaf(childAt(N, End + 1), "."))
      End += 2;
    readDotted(W, N, End);
    for (Py_ssize_t I = End + 1; I < Count; ++I)
      visitSubPattern(W, childAt(N, I));
    return;
  }
  if (Count == 3 && isLeaf(childAt(N, 1), "=")) {
    // A class pattern's keyword argument: the keyword is an attribute name.
    visitSubPattern(W, childAt(N, 2));
    return;
  }
  for (Py_ssize_t I = 0; I < Count; ++I)
    visitSubPattern(W, childAt(N, I));
}

// case_block: CASE patterns [guard] ':' suite. The guard and the body are
// walked as any expression and statement.
void visitCaseBlock(NW *W, PyObject *Node) {
  NodeObject *N = node(Node);
  Py_ssize_t Count = rawCount(N);
  if (Count < 2)
    return;
  visitSubPattern(W, childAt(N, 1));
  for (Py_ssize_t I = 2; I < Count; ++I) {
    Ref Child = ref(childAt(N, I));
    visitNode(W, Child.get());
  }
}

// type_params: '[' type_param (',' type_param)* [','] ']'. Each parameter is
// recorded as the type equivalence (name, ":t:" + its prefix: "", "*" or
// "**"); it binds in the definition's own scope, not the line's, so it is not
// a name the line defines. Bounds, constraints and defaults are read.
void visitTypeParams(NW *W, PyObject *Node) {
  NodeObject *N = node(Node);
  Py_ssize_t Count = rawCount(N);
  for (Py_ssize_t I = 1; I + 1 < Count; I += 2) {
    NodeObject *Param = childAt(N, I);
    NodeObject *Name = Param;
    Py_ssize_t Rest = 0, ParamCount = rawCount(Param);
    const char *Star = "";
    if (ParamCount > 0) {
      Name = childAt(Param, 0);
      Rest = 1;
      if (isLeaf(Name, "*") || isLeaf(Name, "**")) {
        Star = isLeaf(Name, "*") ? "*" : "**";
        Name = childAt(Param, 1);
        Rest = 2;
      }
    }
    if (Name->Text && PyString_Check(Name->Text)) {
      Ref Info = tl::require(PyString_FromFormat("%s%s", PyString_AS_STRING(TypeParamPrefix()), Star));
      tl::requireStatus(host::Host.Fast->AppendTypeEquiv(W->Logical ? W->Logical : Py_None, Name->Text,
                                                          Info.get()));
    }
    for (Py_ssize_t J = Rest; J < ParamCount; ++J) {
      Ref Part = ref(childAt(Param, J));
      if (!isLeaf(node(Part.get()), ":") && !isLeaf(node(Part.get()), "="))
        visitLoadContextNode(W, Part.get());
    }
  }
}

/// The type parameters of a def or class (child 2), when it has them.
void visitTypeParamsOf(NW *W, PyObject *Node) {
  NodeObject *N = node(Node);
  if (rawCount(N) > 2 && isNodeOf(obj(childAt(N, 2)), C::CTypeParams)) {
    Ref Params = ref(childAt(N, 2));
    visitNode(W, Params.get());
  }
}

// type_stmt: TYPE NAME [type_params] '=' test. Binds the name with the value
// as its equivalence and reads the value (its type parameters as above).
void visitTypeAlias(NW *W, PyObject *Node) {
  NodeObject *N = node(Node);
  Py_ssize_t Count = rawCount(N);
  if (Count < 4)
    return;
  Ref Name = ref(childAt(N, 1)), Value = ref(childAt(N, Count - 1));
  visitTypeParamsOf(W, Node);
  appendEquivNode(W, Name.get(), Value.get());
  visitLoadContextNode(W, Value.get());
}

} // namespace walker
} // namespace treelens
