// Parse-tree construction: the grammar-state class records, the node factory and the parser.
#ifndef TREELENS_PARSE_PARSE_H
#define TREELENS_PARSE_PARSE_H

#include "pysource/treelens/nodes/node.h"
#include "pysource/optpgen/optpgen_api.h"

namespace treelens {

// Token type codes of the grammar's numbering that the parser and factory use.
enum TokenCode : int {
  kEndMarker = 0,
  kName = 1,
  kNumber = 2,
  kNewline = 4,
  kColon = 11,
  kAt = 50,
  kRArrow = 51,
  kEllipsis = 52,
  kAwait = 53,
  kAsync = 54,
  kColonEqual = 55,
  // The soft keywords as the parser retypes them, and the '(' that opens
  // parenthesized with items; no text has these types.
  kMatch = 60,
  kCase = 61,
  kType = 62,
  kWithLpar = 63,
  kComment = 202,
  kBackslash = 203,
};

/// Grammar states (token types and symbol numbers) are numbered below this:
/// the pgen engine's own bound on symbol numbers.
constexpr long kMaxStateNumber = 256 + (1L << 20);

/// Most nodes one state's free list keeps: the nodes of one huge line are
/// released instead of held for good.
constexpr Py_ssize_t kMaxFreePerState = 1 << 14;

/// Deepest level DiscardNodes descends to; deeper subtrees are released.
constexpr int kMaxDiscardDepth = 100;

// ---- CNodeClassInfo ----

/// New reference: CNodeClassInfo(Cls, NodeType, Name); Name must be bytes or None.
TL_HIDDEN tl::Ref newClassInfo(PyObject *Cls, int NodeType, PyObject *Name);
/// Releases every node of Info's free list, head first, without recursion.
TL_HIDDEN Py_ssize_t drainFreeList(ClassInfoObject *Info);
/// Number of nodes on Info's free list.
TL_HIDDEN Py_ssize_t freeListLength(ClassInfoObject *Info);
TL_HIDDEN int initClassInfoType(PyObject *Module);

// ---- CNodeFactory ----

/// CNodeFactory. Invariant: ClassInfoList[i] is the class info of state i.
struct FactoryObject {
  PyObject_HEAD
  PyObject *ClassInfoList;            ///< list of CNodeClassInfo
  ClassInfoObject *KeywordClassInfo;  ///< NULL when there are no keywords
  PyObject *Keywords;                 ///< dict: keyword text -> None
};

TL_HIDDEN PyTypeObject &factoryType();
TL_HIDDEN int initFactoryType(PyObject *Module);

/// ConvertSingleNode; Children (borrowed) is kept by the node. New reference.
TL_HIDDEN tl::Ref convertSingleNode(FactoryObject *F, int NodeType, PyObject *Value, PyObject *Context,
                                    PyObject *Children);
/// NewNode: a node of Info's state, from its free list when possible. New reference.
TL_HIDDEN tl::Ref newNode(ClassInfoObject *Info, PyObject *Value, PyObject *Context, PyObject *Children);
/// DiscardNodes: pushes Node and its subtree onto the free lists.
TL_HIDDEN void discardNodes(PyObject *Node, int Depth);
/// RecursiveConvert of a raw (type, value, context, children) tuple tree. New reference.
TL_HIDDEN tl::Ref recursiveConvert(FactoryObject *F, PyObject *Raw);
/// Nodes on all of F's free lists.
TL_HIDDEN Py_ssize_t factoryFreeNodeCount(FactoryObject *F);

// ---- CPGenParserImpl ----

/// CPGenParserImpl; final. Fields in declaration order.
struct ParserObject {
  optpgen::NodeConverterObject Base;
  PyObject *Grammar;
  bool Py3Grammar;
  int FileInputNumber;
  PyObject *Keywords;        ///< dict: keyword text -> None
  PyObject *Parser;          ///< pysource.optpgen.Parser
  FactoryObject *Factory;
  PyObject *Logical;         ///< logical being parsed; NULL for None
  PyObject *ClsForStateList;
  PyObject *GetTime;
  PyObject *CLogicalLine;
  PyObject *VersionTriple;
  bool AsyncAlwaysKeyword;
  // Bound engine methods, used when the engine publishes no native API.
  PyObject *SetupMethod, *AddTokenMethod, *GetRootNodeMethod;
  bool Busy; ///< a parse is in progress: no re-entry, no re-initialisation
  /// Which retyped tokens the grammar has (kHas* bits), read from the grammar
  /// on first use; 0 until then.
  int Retyped;
};

/// Bits of ParserObject::Retyped.
enum : int { kRetypedKnown = 1, kHasMatch = 2, kHasType = 4, kHasWithLpar = 8 };

TL_HIDDEN PyTypeObject &parserType();
/// Readies CPGenParserImpl (after CPGenAnalyzer) and adds it to the module.
TL_HIDDEN int initParserType(PyObject *Module);

/// ParseToNode: the statement node of a logical, or None. New reference.
TL_HIDDEN tl::Ref parseToNode(ParserObject *P, PyObject *Logical, bool InAsyncDef);
/// ParseTokenListToNode: the statement node of a list of token texts, or None.
TL_HIDDEN tl::Ref parseTokenListToNode(ParserObject *P, PyObject *TokList, bool InAsyncDef);
/// DiscardNode: returns a tree to the free lists.
inline void discardNode(ParserObject *, PyObject *Node) { discardNodes(Node, 0); }

} // namespace treelens

#endif
