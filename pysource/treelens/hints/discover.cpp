// Type-comment discovery: the hint walker's Walk, the statements it visits, and finding the type
// comment that ends a statement and the hint text inside it.
#include "pysource/treelens/hints/hintsimpl.h"

#include "pysource/treelens/nodes/expr.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/nodes/stmt.h"
#include "pysource/treelens/nodes/utils.h"

#include <cctype>
#include <cstring>

namespace treelens {
namespace hints {

using host::LogicalLineObject;
using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

const char kBusy[] = "Only one logical may be walked at a time";
constexpr int kComma = 12;

/// What one pass over a logical's token types finds.
struct TokenScan {
  int TypeComments = 0; ///< comment tokens containing "type:"
  int Colons = 0;
  bool Arrow = false;
};

bool containsTypeColon(const char *P, Py_ssize_t N) { return memmem(P, N, "type:", 5) != nullptr; }

TokenScan scanTokens(LogicalLineObject *L) {
  TokenScan S;
  for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
    switch (L->Types[I]) {
    case kComment: {
      PyObject *Text = L->Texts[I];
      if (!Text || Text == Py_None)
        break;
      tl::expectType(PyString_Check(Text), "bytes", Text);
      if (containsTypeColon(PyString_AS_STRING(Text), PyString_GET_SIZE(Text)))
        ++S.TypeComments;
      break;
    }
    case kColon: ++S.Colons; break;
    case kRArrow: S.Arrow = true; break;
    default: break;
    }
  }
  return S;
}

/// True when the dispatch table still holds the entries the constructor put there.
bool ownDispatchTable(HW *W) {
  PyObject *D = W->Base.DispatchDict;
  auto Entry = [&](C Class) { return PyDict_GetItem(D, reinterpret_cast<PyObject *>(&nodeType(Class))); };
  return D && PyDict_CheckExact(D) && PyDict_Size(D) == 5 && Entry(C::CFuncdefStmt) == HK.VisitFuncdef &&
         Entry(C::CExprStmt) == HK.VisitExprStmt && Entry(C::CForStmt) == HK.VisitFor &&
         Entry(C::CWithStmt) == HK.VisitWith && Entry(C::CNameLiteral) == Py_False;
}

/// Whether a walk of Node can record anything on a line without type comments: only annotations
/// then, of a def (which needs "->" or a colon besides its own) or of an annotated assignment.
/// Expressions hold no statements, and for and with statements are not descended into. Deep or
/// odd trees answer true, so the walk itself decides.
bool mayRecordAnnotations(PyObject *Node, const TokenScan &S, int Depth) {
  if (Depth > 50 || !isNode(Node))
    return true;
  PyTypeObject *T = Py_TYPE(Node);
  if (T == &nodeType(C::CFuncdefStmt))
    return S.Arrow || S.Colons > 1;
  if (T == &nodeType(C::CExprStmt))
    return exprStmtGetAnnotatedAssignNode(node(Node)).get() != Py_None;
  if (T == &nodeType(C::CForStmt) || T == &nodeType(C::CWithStmt) || isNodeOf(Node, C::CExpression))
    return false;
  PyObject *Children = node(Node)->Children;
  if (!Children)
    return false;
  Ref Keep = Ref::borrow(Children);
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Children); ++I) {
    Ref Child = Ref::borrow(PyList_GET_ITEM(Children, I));
    if (mayRecordAnnotations(Child.get(), S, Depth + 1))
      return true;
  }
  return false;
}

/// The logical of the walk in progress as a record; TypeError when it is none.
LogicalLineObject *walkedLogical(HW *W) {
  PyObject *L = logicalOf(W);
  if (L == Py_None)
    tl::raise(PyExc_AttributeError, "'NoneType' object has no attribute 'fTokens'");
  if (!host::isLogical(L))
    tl::raise(PyExc_TypeError, "logical must be a logical line");
  return reinterpret_cast<LogicalLineObject *>(L);
}

/// Number of items str.splitlines gives for a byte string.
long lineCount(PyObject *Text) {
  tl::expectType(PyString_Check(Text), "bytes", Text);
  const char *P = PyString_AS_STRING(Text), *End = P + PyString_GET_SIZE(Text);
  long Lines = 0;
  bool Open = false;
  for (; P < End; ++P) {
    if (*P == '\n' || *P == '\r') {
      if (*P == '\r' && P + 1 < End && P[1] == '\n')
        ++P;
      ++Lines;
      Open = false;
    } else {
      Open = true;
    }
  }
  return Lines + (Open ? 1 : 0);
}

/// Row range of one token leaf: (row, row + its line count).
std::pair<long, long> leafRows(LogicalLineObject *L, NodeObject *N) {
  if (!N->Context)
    tl::raise(PyExc_TypeError, "node has no token index");
  Py_ssize_t I = indexArg(N->Context);
  if (I > L->TokenCount - 1)
    I = L->TokenCount - 1;
  if (I < 0)
    I += L->TokenCount;
  if (I < 0)
    tl::raise(PyExc_IndexError, "tuple index out of range");
  long Row = L->Positions[I].Row;
  return {Row, Row + (L->Texts[I] ? lineCount(L->Texts[I]) : 0)};
}

/// The first (or last) leaf under Node, following first (or last) children.
NodeObject *edgeLeaf(PyObject *Node, bool Last) {
  PyObject *Cur = Node;
  for (int Steps = 0;; ++Steps) {
    if (!isNode(Cur))
      raiseCannotConvert(Cur, cnodeType());
    NodeObject *N = node(Cur);
    if (N->Text && N->Text != Py_None)
      return N;
    if (!N->Children || !PyList_Check(N->Children))
      tl::raise(PyExc_TypeError, "'NoneType' object has no attribute '__getitem__'");
    Py_ssize_t Count = PyList_GET_SIZE(N->Children);
    if (Count == 0)
      tl::raise(PyExc_IndexError, "list index out of range");
    if (Steps > 100000)
      tl::raise(PyExc_RuntimeError, "maximum recursion depth exceeded in _GetRowRange");
    Cur = PyList_GET_ITEM(N->Children, Last ? Count - 1 : 0);
  }
}

bool isBlank(char C) { return std::isspace(static_cast<unsigned char>(C)) != 0; }

} // namespace

// ---- Walk ----

void hintWalk(HW *W, PyObject *Node, PyObject *Logical) {
  // A nested walk must not touch the count of the walk in progress.
  if (W->Base.Logical)
    tl::raise(PyExc_ValueError, kBusy);
  LogicalLineObject *L = host::requireLogical(Logical);
  Ref KeepWalker = Ref::borrow(reinterpret_cast<PyObject *>(W));
  Ref KeepLogical = Ref::borrow(Logical);
  struct ResetCount {
    HW *W;
    ~ResetCount() { W->CommentHintCount = 0; }
  } Reset{W};
  TokenScan S = scanTokens(L);
  W->CommentHintCount += S.TypeComments;
  if (Node != Py_None) {
    if (!isNode(Node))
      raiseCannotConvert(Node, cnodeType());
    // Without type comments only annotations can be recorded; a line that has none is not walked.
    if (W->CommentHintCount == 0 && ownDispatchTable(W) && !mayRecordAnnotations(Node, S, 0))
      return;
    walker::dispatchWalkBase(&W->Base, Node, Logical);
    return;
  }
  if (W->CommentHintCount == 0)
    return;
  // A line without code: a signature comment standing on the first line of a function body.
  Py_INCREF(Logical);
  W->Base.Logical = Logical;
  bool Ok = tl::guard<bool>(false, [&] {
    Ref Comment = findComment(W, 0, Logical);
    if (Comment.get() == Py_None)
      return true;
    Ref Hint = getHintFromComment(Comment.get());
    if (Hint.get() != Py_None)
      processFuncdefComment(W, Hint.get(), Py_None, false);
    return true;
  });
  PyObject *Walked = W->Base.Logical;
  W->Base.Logical = nullptr;
  Py_XDECREF(Walked);
  if (!Ok)
    throw tl::PyErrSet();
}

// ---- Statement visits ----

void visitForStmt(HW *W, PyObject *Node) {
  if (W->CommentHintCount == 0)
    return;
  if (!isNodeOf(Node, C::CForStmt))
    raiseCannotConvert(Node, nodeType(C::CForStmt));
  processTarget(W, Node, forStmtGetTarget(node(Node)).get());
}

void visitWithStmt(HW *W, PyObject *Node) {
  if (W->CommentHintCount == 0)
    return;
  if (!isNodeOf(Node, C::CWithStmt))
    raiseCannotConvert(Node, nodeType(C::CWithStmt));
  Ref Items = withStmtGetWithItems(node(Node));
  if (Items.get() == Py_None)
    tl::raise(PyExc_TypeError, "'NoneType' object is not iterable");
  tl::expectType(PyList_Check(Items.get()), "list", Items.get());
  // Every item is offered the one comment that ends the whole statement.
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Items.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(Items.get(), I));
    if (!isNodeOf(Item.get(), C::CWithItem))
      raiseCannotConvert(Item.get(), nodeType(C::CWithItem));
    processTarget(W, Node, withItemGetTarget(node(Item.get())).get());
  }
}

void visitExprStmt(HW *W, PyObject *Node) {
  if (!isNodeOf(Node, C::CExprStmt))
    raiseCannotConvert(Node, nodeType(C::CExprStmt));
  NodeObject *N = node(Node);
  Ref Ann = exprStmtGetAnnotatedAssignNode(N);
  if (Ann.get() != Py_None) {
    if (!isNodeOf(Ann.get(), C::CAnnotatedAssignNode))
      raiseCannotConvert(Ann.get(), nodeType(C::CAnnotatedAssignNode));
    processNameAndHintNodes(W, exprStmtGetInitialTestExpr(N).get(), annAssignGetTypeHintNode(node(Ann.get())).get(),
                            false);
  }
  // Only the first target of a chained assignment takes the comment's hint.
  if (W->CommentHintCount != 0 && exprStmtGetEqualCount(N) != 0)
    processTarget(W, Node, exprStmtGetInitialTestExpr(N).get());
}

void processTarget(HW *W, PyObject *Statement, PyObject *Target) {
  Ref Hint = findEndingTypeComment(W, Statement);
  if (Hint.get() != Py_None)
    recordHintText(W, Target, Hint.get(), false);
}

// ---- Finding the comment ----

std::pair<long, long> getRowRange(HW *W, PyObject *Node, bool WantFirst) {
  LogicalLineObject *L = walkedLogical(W);
  if (!isNode(Node))
    raiseCannotConvert(Node, cnodeType());
  long First = WantFirst ? leafRows(L, edgeLeaf(Node, false)).first : 0;
  return {First, leafRows(L, edgeLeaf(Node, true)).second};
}

Ref findEndingTypeComment(HW *W, PyObject *Node) {
  if (Node == Py_None)
    return none();
  long Row = getRowRange(W, Node, false).second - 1;
  Ref Comment = findComment(W, Row, nullptr);
  if (Comment.get() == Py_None)
    return Comment;
  tl::expectType(PyString_Check(Comment.get()), "bytes", Comment.get());
  return getHintFromComment(Comment.get());
}

Ref findComment(HW *W, long Row, PyObject *Logical) {
  if (!Logical || Logical == Py_None)
    Logical = logicalOf(W);
  if (!host::isLogical(Logical))
    tl::raise(PyExc_TypeError, "logical must be a logical line");
  auto *L = reinterpret_cast<LogicalLineObject *>(Logical);
  // Tokens are in position order: the scan stops at the first token past the row.
  for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
    long R = L->Positions[I].Row;
    if (R > Row)
      break;
    PyObject *Text = L->Texts[I];
    if (R == Row && Text && PyString_Check(Text) && PyString_GET_SIZE(Text) > 0 && PyString_AS_STRING(Text)[0] == '#')
      return Ref::borrow(Text);
  }
  return none();
}

// COMMENT: [text] '#' blanks 'type:' blanks HINT blanks
// The hint is everything after the first "type:", so "# type: int  # note" keeps its note; the
// text before "type:" must end with "#", so "# the type: int" is no type comment.
Ref getHintFromComment(PyObject *Comment) {
  tl::expectType(PyString_Check(Comment), "bytes", Comment);
  const char *S = PyString_AS_STRING(Comment);
  Py_ssize_t Size = PyString_GET_SIZE(Comment);
  const char *Found = static_cast<const char *>(memmem(S, Size, "type:", 5));
  if (!Found)
    return none();
  const char *Before = Found;
  while (Before > S && isBlank(Before[-1]))
    --Before;
  if (Before == S || Before[-1] != '#')
    return none();
  const char *Begin = Found + 5, *End = S + Size;
  while (Begin < End && isBlank(*Begin))
    ++Begin;
  while (End > Begin && isBlank(End[-1]))
    --End;
  // "ignore", alone or before error codes, blanks or a further comment, silences a checker and
  // is no type.
  Py_ssize_t Len = End - Begin;
  if (Len >= 6 && std::memcmp(Begin, "ignore", 6) == 0 &&
      (Len == 6 || Begin[6] == '[' || Begin[6] == '#' || isBlank(Begin[6])))
    return none();
  return tl::require(PyString_FromStringAndSize(Begin, Len));
}

bool isDottedName(PyObject *Text) {
  tl::expectType(PyString_Check(Text), "bytes", Text);
  const char *P = PyString_AS_STRING(Text), *End = P + PyString_GET_SIZE(Text);
  bool SegmentStart = true;
  for (; P < End; ++P) {
    unsigned char Ch = static_cast<unsigned char>(*P);
    if (Ch == '.') {
      SegmentStart = true;
      continue;
    }
    bool Ok = Ch == '_' || (SegmentStart ? std::isalpha(Ch) : std::isalnum(Ch));
    if (!Ok)
      return false;
    SegmentStart = false;
  }
  return true;
}

// ---- Per-parameter comments need the token types of the walked logical ----

void processArgSpecificComment(HW *W, PyObject *Arg) {
  if (!PyObject_TypeCheck(Arg, &argInfoType()))
    raiseCannotConvert(Arg, argInfoType());
  auto *A = reinterpret_cast<ArgInfoObject *>(Arg);
  if (!A->Name || A->Name == Py_None)
    return;
  Ref Name = Ref::borrow(A->Name);
  PyObject *Last = A->Value && A->Value != Py_None       ? A->Value
                   : A->TypeExpr && A->TypeExpr != Py_None ? A->TypeExpr
                                                          : A->Name;
  Py_ssize_t End = getTokenEndIndex(Last);
  if (End == -2 && PyErr_Occurred())
    throw tl::PyErrSet();
  LogicalLineObject *L = walkedLogical(W);
  if (End < 0 || End >= L->TokenCount)
    return;
  if (L->Types[End] == kComma && ++End >= L->TokenCount)
    return;
  if (L->Types[End] != kComment)
    return;
  Ref Comment = Ref::borrow(L->Texts[End] ? L->Texts[End] : Py_None);
  Ref Hint = getHintFromComment(Comment.get());
  if (Hint.get() != Py_None)
    recordHintText(W, Name.get(), Hint.get(), true);
}

} // namespace hints
} // namespace treelens
