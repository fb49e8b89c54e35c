// The type-hint walker's layout and operations, shared by its discovery (discover.cpp), recording
// (record.cpp) and Python surface (hints.cpp). Every operation throws tl::PyErrSet with a Python
// error set on failure; object arguments are borrowed.
#ifndef TREELENS_HINTS_HINTSIMPL_H
#define TREELENS_HINTS_HINTSIMPL_H

#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/records.h"
#include "pysource/treelens/parse/parse.h"
#include "pysource/treelens/walker/walker.h"

#include <utility>

namespace treelens {
namespace hints {

/// CTypeHintWalker; final. The CDispatchWalker fields first, then its own in declaration order.
/// Invariant: CommentHintCount is 0 between walks; Base.Logical is NULL (None) between walks.
struct TypeHintWalkerObject {
  walker::DispatchWalkerObject Base;
  PyObject *NameConv;      ///< CNodeToTextConverter with default options: renders targets
  PyObject *HintConv;      ///< CNodeToTextConverter with bracket text and string contents: renders hints
  int CommentHintCount;    ///< comment tokens of the current logical containing "type:"
  ParserObject *HintParser; ///< parser of the hint grammar
};

using HW = TypeHintWalkerObject;

/// Texts made once at start-up (owned for the process).
struct HintConstants {
  PyObject *Return;            ///< "return"
  PyObject *AppendTypeEquiv, *AppendArgTypeEquiv, *ArgNamesAttr, *ParentScopeAttr, *KindAttr;
  PyObject *BuildArgInfo;      ///< pysource.symbolinfo.BuildArgInfo
  PyObject *DummyName, *Colon; ///< "a", ":" of rewritten signatures
  /// The constructor's dispatch entries (the type's own method descriptors).
  PyObject *VisitFuncdef, *VisitExprStmt, *VisitFor, *VisitWith;
};
TL_HIDDEN extern HintConstants HK;
TL_HIDDEN void initHintConstants();

/// The record being walked (borrowed), or Py_None.
inline PyObject *logicalOf(HW *W) { return W->Base.Logical ? W->Base.Logical : Py_None; }

// ---- Discovery ----
TL_HIDDEN void hintWalk(HW *W, PyObject *Node, PyObject *Logical);
TL_HIDDEN void visitForStmt(HW *W, PyObject *Node);
TL_HIDDEN void visitWithStmt(HW *W, PyObject *Node);
TL_HIDDEN void visitExprStmt(HW *W, PyObject *Node);
TL_HIDDEN void processTarget(HW *W, PyObject *Statement, PyObject *Target);
/// _GetRowRange: (first row, end row), the end exclusive.
TL_HIDDEN std::pair<long, long> getRowRange(HW *W, PyObject *Node, bool WantFirst = true);
/// _FindEndingTypeComment: hint text or None. New reference.
TL_HIDDEN tl::Ref findEndingTypeComment(HW *W, PyObject *Node);
/// _FindComment: the first comment token text on Row, or None. Logical NULL means the walked one.
TL_HIDDEN tl::Ref findComment(HW *W, long Row, PyObject *Logical);
/// _GetHintFromComment: hint text or None. New reference.
TL_HIDDEN tl::Ref getHintFromComment(PyObject *Comment);
TL_HIDDEN bool isDottedName(PyObject *Text);

// ---- Parsing and recording ----
/// _ParseHint / _ParseHintTokList: the hint's tree (the hint parser's, to be discarded) or None.
TL_HIDDEN tl::Ref parseHint(HW *W, PyObject *Hint);
TL_HIDDEN tl::Ref parseHintTokList(HW *W, PyObject *Tokens);
/// A parsed hint as the callers use it: an expression node, or None (anything else is discarded).
TL_HIDDEN tl::Ref parsedHintExpression(HW *W, tl::Ref Parsed);
/// Returns a hint tree to the hint parser's free lists, keeping a pending exception.
TL_HIDDEN void discardHint(HW *W, PyObject *Node);
/// Parses a hint text and records it for Target (processNameAndHintNodes);
/// the tree goes back to the free lists whatever happens.
TL_HIDDEN void recordHintText(HW *W, PyObject *Target, PyObject *Hint, bool IsArg);
TL_HIDDEN tl::Ref rewriteFuncdefCommentHint(PyObject *Hint);
TL_HIDDEN void processFuncdefComment(HW *W, PyObject *Hint, PyObject *FuncdefLogical, bool IsArg);
TL_HIDDEN void processArgSpecificComment(HW *W, PyObject *Arg);
TL_HIDDEN void processNameAndHintNodes(HW *W, PyObject *NameNode, PyObject *HintNode, bool IsArg);
TL_HIDDEN void addSymInfo(HW *W, PyObject *Name, PyObject *IStr, bool IsArg);
/// _GetHintInfoStr: info bytes or None. New reference.
TL_HIDDEN tl::Ref getHintInfoStr(HW *W, PyObject *Node);
TL_HIDDEN void visitFuncdefStmt(HW *W, PyObject *Node);

/// kTypeHintPrefix + Text (bytes). New reference.
TL_HIDDEN tl::Ref hintInfo(PyObject *Text);

} // namespace hints
} // namespace treelens

#endif
