// CNodeToTextConverter: names, dotted names, calls, subscripts, literals and composite expressions
// rendered back to text, with the host's EncodeStringLiteral and JoinTokens.
#include "pysource/treelens/nodes/totext.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/expr.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/nodes/utils.h"

#include <initializer_list>
#include <string>

namespace treelens {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

PyTypeObject ConverterType;

/// Interned texts and names, made once at start-up.
struct TextNames {
  PyObject *TextForNode;
  PyObject *EmptyString, *EmptyUnicode;              ///< "''", "u''"
  PyObject *EmptyBrackets, *EmptyBraces, *EmptyParens; ///< "[]", "{}", "( )"
  PyObject *Power;                                    ///< "**"
  PyObject *JoinTokens;                               ///< pysource.symbolinfo.JoinTokens
};
TextNames Names;

ConverterObject *conv(PyObject *O) { return reinterpret_cast<ConverterObject *>(O); }
PyObject *convObj(ConverterObject *Cv) { return reinterpret_cast<PyObject *>(Cv); }

ConverterObject *requireConverter(PyObject *O) {
  if (!PyObject_TypeCheck(O, &ConverterType))
    raiseCannotConvert(O, ConverterType);
  return conv(O);
}

/// A byte-string-or-None result of an override; TypeError otherwise.
Ref checkedText(Ref R) {
  if (R.get() != Py_None)
    tl::expectType(PyString_Check(R.get()), "bytes", R.get());
  return R;
}

/// JoinTokens(Texts): the host's spacing of a list of token texts.
Ref joinTokens(PyObject *Texts) {
  return checkedText(tl::require(PyObject_CallFunctionObjArgs(Names.JoinTokens, Texts, nullptr)));
}

/// JoinTokens of a few texts given as borrowed objects.
Ref joinTexts(std::initializer_list<PyObject *> Texts) {
  Ref List = tl::require(PyList_New(static_cast<Py_ssize_t>(Texts.size())));
  Py_ssize_t K = 0;
  for (PyObject *T : Texts) {
    Py_INCREF(T);
    PyList_SET_ITEM(List.get(), K++, T);
  }
  return joinTokens(List.get());
}

/// "None", "True" and "False": the names literal_only keeps.
bool isLiteralName(PyObject *Text) {
  return textIs(Text, "None") || textIs(Text, "True") || textIs(Text, "False");
}

/// The bytes a string literal may hold to be rendered with its contents:
/// ASCII letters and digits, blank, both quotes, comma, full stop, underscore,
/// and every byte from 0x7F up.
bool isPlainStringByte(unsigned char B) {
  if (B >= 0x7F)
    return true;
  if ((B >= 'a' && B <= 'z') || (B >= 'A' && B <= 'Z') || (B >= '0' && B <= '9'))
    return true;
  return B == ' ' || B == '"' || B == '\'' || B == ',' || B == '.' || B == '_';
}

/// Runs Body one C recursion level deeper, so that a cyclic tree raises
/// RuntimeError instead of overflowing the stack.
template <class F> Ref nested(F &&Body) {
  if (Py_EnterRecursiveCall(" while rendering a node to text"))
    throw tl::PyErrSet();
  try {
    Ref R = Body();
    Py_LeaveRecursiveCall();
    return R;
  } catch (...) {
    Py_LeaveRecursiveCall();
    throw;
  }
}

Ref ownTextForNode(ConverterObject *Cv, NodeObject *N, TextOptions O);
Ref ownTextForAtomPlusTrailers(ConverterObject *Cv, PyObject *Atom, PyObject *Trailers, TextOptions O);

Ref ownTextForStringLiteral(ConverterObject *Cv, NodeObject *N) {
  if (Cv->IncludeStringContents) {
    PyObject *Text = N->Text ? N->Text : Py_None;
    tl::expectType(PyString_Check(Text), "bytes", Text);
    const unsigned char *P = reinterpret_cast<const unsigned char *>(PyString_AS_STRING(Text));
    const unsigned char *End = P + PyString_GET_SIZE(Text);
    while (P != End && isPlainStringByte(*P))
      ++P;
    if (P == End)
      return checkedText(host::callOne(host::Host.EncodeStringLiteral, Text));
  }
  return Ref::borrow(stringIsUnicode(N) ? Names.EmptyUnicode : Names.EmptyString);
}

/// Composite text: JoinTokens of the texts of N's children, None when one has none.
Ref compositeText(ConverterObject *Cv, NodeObject *N, TextOptions O) {
  if (!Cv->IncludeBracketText)
    return none();
  TextOptions ChildOptions = O;
  ChildOptions.DottedNameOnly = false;
  Ref Texts = tl::require(PyList_New(0));
  // A Python override of TextForNode may change the children list, so it is
  // read again at each step and each child is held while it is rendered.
  for (Py_ssize_t K = 0; K < rawCount(N); ++K) {
    Ref Child = ref(childAt(N, K));
    Ref Text = textForNode(convObj(Cv), Child.get(), ChildOptions);
    if (Text.get() == Py_None)
      return Text;
    tl::requireStatus(PyList_Append(Texts.get(), Text.get()));
  }
  return joinTokens(Texts.get());
}

/// An atom_expr or power: its atom with its trailers, and, when present, the
/// "await" before it or the exponent after it (both composite text).
Ref atomPlusTrailersText(ConverterObject *Cv, NodeObject *N, TextOptions O) {
  bool IsPower = isNodeOf(obj(N), C::CPower);
  Ref Extra = IsPower ? powerGetExponentNode(N) : atomExprGetPrefix(N);
  if (Extra.get() == Py_None) {
    Ref Atom = IsPower ? powerGetAtom(N) : atomExprGetAtom(N);
    Ref Trailers = IsPower ? powerGetTrailers(N) : atomExprGetTrailers(N);
    return ownTextForAtomPlusTrailers(Cv, Atom.get(), Trailers.get(), O);
  }
  if (O.DottedNameOnly || !Cv->IncludeBracketText)
    return none();
  if (!IsPower) {
    Ref Atom = atomExprGetAtom(N);
    Ref Trailers = atomExprGetTrailers(N);
    Ref Base = ownTextForAtomPlusTrailers(Cv, Atom.get(), Trailers.get(), O);
    if (Base.get() == Py_None)
      return Base;
    PyObject *Await = isNode(Extra.get()) ? node(Extra.get())->Text : nullptr;
    tl::expectType(Await && PyString_Check(Await), "bytes", Await ? Await : Py_None);
    return joinTexts({Await, Base.get()});
  }
  // power: atom_expr '**' factor (3.x) or atom trailer* '**' factor (2.7).
  Ref Base;
  NodeObject *First = childAt(N, 0);
  if (isNodeOf(obj(First), C::CAtomExpr)) {
    Ref Held = ref(First);
    Base = textForNode(convObj(Cv), Held.get(), O);
  } else {
    Ref Atom = powerGetAtom(N);
    Ref Trailers = powerGetTrailers(N);
    Base = ownTextForAtomPlusTrailers(Cv, Atom.get(), Trailers.get(), O);
  }
  if (Base.get() == Py_None)
    return Base;
  Ref Exponent = textForNode(convObj(Cv), Extra.get(), O);
  if (Exponent.get() == Py_None)
    return Exponent;
  return joinTexts({Base.get(), Names.Power, Exponent.get()});
}

Ref ownTextForNode(ConverterObject *Cv, NodeObject *N, TextOptions O) {
  return nested([&]() -> Ref {
    Ref Held;
    if (O.DiscardSimpleParens) {
      Held = dropSimpleParens(obj(N));
      if (!isNode(Held.get()))
        raiseCannotConvert(Held.get(), cnodeType());
      N = node(Held.get());
    }
    PyObject *Self = obj(N);
    if (N->Text) {
      bool Name = isNodeOf(Self, C::CNameLiteral);
      if (O.DottedNameOnly && !Name)
        return none();
      if (O.LiteralOnly && Name && !isLiteralName(N->Text))
        return none();
      if (isNodeOf(Self, C::CStringLiteral))
        return ownTextForStringLiteral(Cv, N);
      return Ref::borrow(N->Text);
    }
    if (isNodeOf(Self, C::CAtomExpr) || isNodeOf(Self, C::CPower))
      return atomPlusTrailersText(Cv, N, O);
    if (O.DottedNameOnly)
      return none();
    if (isNodeOf(Self, C::CAtom)) {
      Ref Bracket = atomGetInitialBracket(N);
      if (textIs(Bracket.get(), "{") || textIs(Bracket.get(), "[")) {
        if (!Cv->IncludeBracketText)
          return Ref::borrow(PyString_AS_STRING(Bracket.get())[0] == '{' ? Names.EmptyBraces
                                                                           : Names.EmptyBrackets);
      } else if (textIs(Bracket.get(), "(")) {
        if (Cv->IncludeBracketText && rawCount(N) == 2 && leafIs(childAt(N, 1), ")"))
          return Ref::borrow(Names.EmptyParens);
      } else if (Bracket.get() == Py_None && rawCount(N) > 0) {
        bool AllStrings = true;
        for (Py_ssize_t K = 0; K < rawCount(N) && AllStrings; ++K)
          AllStrings = isNodeOf(PyList_GET_ITEM(N->Children, K), C::CStringLiteral);
        if (AllStrings) {
          // Implicit concatenation: every part is rendered, the first gives the text.
          Ref First;
          for (Py_ssize_t K = 0; K < rawCount(N); ++K) {
            Ref Part = ref(childAt(N, K));
            Ref Text = ownTextForStringLiteral(Cv, node(Part.get()));
            if (K == 0)
              First = std::move(Text);
          }
          return First;
        }
      }
    }
    return compositeText(Cv, N, O);
  });
}

/// The text a "(" or "[" trailer adds: the brackets around the nested node's
/// text. The text of a composite node is spaced by JoinTokens as inside those
/// brackets, where ":" and "=" are written without blanks (a[1:2], f(a=1)).
void appendBracketTrailer(ConverterObject *Cv, NodeObject *Trailer, const char *Open, const char *Close,
                          bool WithContents, bool DottedNameOnly, std::string &Out) {
  if (WithContents) {
    Ref Inner = trailerGetNestedNode(Trailer);
    if (Inner.get() != Py_None) {
      TextOptions InnerOptions;
      InnerOptions.DottedNameOnly = DottedNameOnly;
      bool Leaf = isNode(Inner.get()) && node(Inner.get())->Text;
      Ref Text = textForNode(convObj(Cv), Inner.get(), InnerOptions);
      if (Text.get() != Py_None && Leaf) {
        Out += Open;
        Out.append(PyString_AS_STRING(Text.get()), PyString_GET_SIZE(Text.get()));
        Out += Close;
        return;
      }
      if (Text.get() != Py_None) {
        Ref OpenText = tl::require(PyString_FromString(Open));
        Ref CloseText = tl::require(PyString_FromString(Close));
        Ref Joined = joinTexts({OpenText.get(), Text.get(), CloseText.get()});
        Out.append(PyString_AS_STRING(Joined.get()), PyString_GET_SIZE(Joined.get()));
        return;
      }
    }
  }
  Out += Open;
  Out += Close;
}

Ref ownTextForAtomPlusTrailers(ConverterObject *Cv, PyObject *Atom, PyObject *Trailers, TextOptions O) {
  if (!PyList_Check(Trailers))
    raiseArgType("trailers", "list", Trailers);
  if (!isNode(Atom))
    raiseArgType("atom_node", cnodeType().tp_name, Atom);
  bool NoTrailers = PyList_GET_SIZE(Trailers) == 0;
  TextOptions AtomOptions = O;
  AtomOptions.DiscardSimpleParens = NoTrailers && O.DiscardSimpleParens;
  Ref AtomText = textForNode(convObj(Cv), Atom, AtomOptions);
  if (AtomText.get() == Py_None || NoTrailers)
    return AtomText;
  std::string Out(PyString_AS_STRING(AtomText.get()), PyString_GET_SIZE(AtomText.get()));
  for (Py_ssize_t K = 0; K < PyList_GET_SIZE(Trailers); ++K) {
    Ref Trailer = Ref::borrow(PyList_GET_ITEM(Trailers, K));
    if (!isNodeOf(Trailer.get(), C::CTrailer))
      raiseCannotConvert(Trailer.get(), nodeType(C::CTrailer));
    NodeObject *T = node(Trailer.get());
    Ref Tok = trailerGetInitialToken(T);
    bool Dot = textIs(Tok.get(), ".");
    if (O.DottedNameOnly && !Dot)
      return none();
    if (Dot) {
      if (O.LiteralOnly)
        return none();
      Ref Name = trailerGetDotName(T);
      if (Name.get() != Py_None) {
        tl::expectType(PyString_Check(Name.get()), "bytes", Name.get());
        if (!Out.empty() && Out.back() >= '0' && Out.back() <= '9') {
          // After a number the dot may need a blank: 3 .real is not 3. real.
          Ref Head = tl::require(PyString_FromStringAndSize(Out.data(), static_cast<Py_ssize_t>(Out.size())));
          Ref Dot = tl::require(PyString_FromString("."));
          Ref Joined = joinTexts({Head.get(), Dot.get(), Name.get()});
          Out.assign(PyString_AS_STRING(Joined.get()), PyString_GET_SIZE(Joined.get()));
        } else {
          Out += '.';
          Out.append(PyString_AS_STRING(Name.get()), PyString_GET_SIZE(Name.get()));
        }
      }
    } else if (textIs(Tok.get(), "(")) {
      appendBracketTrailer(Cv, T, "(", ")", Cv->IncludeArgText, O.LiteralOnly, Out);
    } else if (textIs(Tok.get(), "[")) {
      appendBracketTrailer(Cv, T, "[", "]", Cv->IncludeBracketText, O.LiteralOnly, Out);
    } else {
      tl::raise(PyExc_ValueError, "Bad trailer node");
    }
  }
  return tl::require(PyString_FromStringAndSize(Out.data(), static_cast<Py_ssize_t>(Out.size())));
}

} // namespace

PyTypeObject &nodeToTextConverterType() { return ConverterType; }

Ref newNodeToTextConverter(bool IncludeBracketText, bool IncludeStringContents, bool IncludeArgText) {
  Ref R = tl::require(ConverterType.tp_alloc(&ConverterType, 0));
  ConverterObject *Cv = conv(R.get());
  Cv->IncludeBracketText = IncludeBracketText;
  Cv->IncludeStringContents = IncludeStringContents;
  Cv->IncludeArgText = IncludeArgText;
  return R;
}

Ref textForNode(PyObject *Conv, PyObject *Node, TextOptions O) {
  ConverterObject *Cv = requireConverter(Conv);
  if (tl::pythonOverride(Conv, Names.TextForNode)) {
    Ref Result = tl::callMethod(Conv, Names.TextForNode, Node, O.DottedNameOnly ? Py_True : Py_False,
                                O.DiscardSimpleParens ? Py_True : Py_False, O.LiteralOnly ? Py_True : Py_False);
    return checkedText(std::move(Result));
  }
  if (!isNode(Node))
    raiseCannotConvert(Node, cnodeType());
  return ownTextForNode(Cv, node(Node), O);
}

Ref textForAtomPlusTrailers(PyObject *Conv, PyObject *Atom, PyObject *Trailers, TextOptions O) {
  return ownTextForAtomPlusTrailers(requireConverter(Conv), Atom, Trailers, O);
}

Ref textForStringLiteral(PyObject *Conv, PyObject *Node) {
  ConverterObject *Cv = requireConverter(Conv);
  if (!isNodeOf(Node, C::CStringLiteral))
    raiseCannotConvert(Node, nodeType(C::CStringLiteral));
  return ownTextForStringLiteral(Cv, node(Node));
}

// ---- Python surface ----

namespace {

bool truthArg(PyObject *O, bool Default) { return O ? tl::isTrue(O) : Default; }

/// Reads the three keyword options that follow the leading arguments.
TextOptions optionsArgs(PyObject *DottedNameOnly, PyObject *DiscardSimpleParens, PyObject *LiteralOnly) {
  TextOptions O;
  O.DottedNameOnly = truthArg(DottedNameOnly, false);
  O.DiscardSimpleParens = truthArg(DiscardSimpleParens, true);
  O.LiteralOnly = truthArg(LiteralOnly, false);
  return O;
}

int converter_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    static const char *Keywords[] = {"include_bracket_text", "include_string_contents", "include_arg_text",
                                     nullptr};
    PyObject *Bracket = nullptr, *String = nullptr, *Arg = nullptr;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "|OOO:CNodeToTextConverter", const_cast<char **>(Keywords),
                                     &Bracket, &String, &Arg))
      return -1;
    ConverterObject *Cv = conv(Self);
    Cv->IncludeBracketText = truthArg(Bracket, false);
    Cv->IncludeStringContents = truthArg(String, false);
    Cv->IncludeArgText = truthArg(Arg, false);
    return 0;
  });
}

PyObject *converter_TextForNode(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"node", "dotted_name_only", "discard_simple_parens", "literal_only",
                                     nullptr};
    PyObject *Node, *Dotted = nullptr, *Parens = nullptr, *Literal = nullptr;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|OOO:TextForNode", const_cast<char **>(Keywords), &Node,
                                     &Dotted, &Parens, &Literal))
      throw tl::PyErrSet();
    if (!isNode(Node))
      raiseArgType("node", cnodeType().tp_name, Node);
    return ownTextForNode(conv(Self), node(Node), optionsArgs(Dotted, Parens, Literal)).release();
  });
}

PyObject *converter_TextForStringLiteral(PyObject *Self, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr, [&] {
    if (!isNodeOf(Node, C::CStringLiteral))
      raiseArgType("node", nodeType(C::CStringLiteral).tp_name, Node);
    return ownTextForStringLiteral(conv(Self), node(Node)).release();
  });
}

PyObject *converter_TextForAtomPlusTrailers(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"atom_node",    "trailers", "dotted_name_only", "discard_simple_parens",
                                     "literal_only", nullptr};
    PyObject *Atom, *Trailers, *Dotted = nullptr, *Parens = nullptr, *Literal = nullptr;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO|OOO:TextForAtomPlusTrailers", const_cast<char **>(Keywords),
                                     &Atom, &Trailers, &Dotted, &Parens, &Literal))
      throw tl::PyErrSet();
    if (!isNode(Atom))
      raiseArgType("atom_node", cnodeType().tp_name, Atom);
    if (!PyList_Check(Trailers))
      raiseArgType("trailers", "list", Trailers);
    TextOptions O = optionsArgs(Dotted, Parens, Literal);
    return ownTextForAtomPlusTrailers(conv(Self), Atom, Trailers, O).release();
  });
}

PyMethodDef ConverterMethods[] = {
    {"TextForNode", tl::kwFunction(converter_TextForNode), METH_VARARGS | METH_KEYWORDS,
     "TextForNode(node, dotted_name_only=False, discard_simple_parens=True, literal_only=False)"
     " -> bytes or None: the source text of node"},
    {"_TextForStringLiteral", converter_TextForStringLiteral, METH_O,
     "_TextForStringLiteral(node) -> bytes: the encoded literal, or '' / u'' when its contents are left out"},
    {"TextForAtomPlusTrailers", tl::kwFunction(converter_TextForAtomPlusTrailers), METH_VARARGS | METH_KEYWORDS,
     "TextForAtomPlusTrailers(atom_node, trailers, dotted_name_only=False, discard_simple_parens=True,"
     " literal_only=False) -> bytes or None: the atom followed by its trailers"},
    {nullptr, nullptr, 0, nullptr}};

} // namespace

int initNodeToTextType(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    Names.TextForNode = tl::internName("TextForNode");
    Names.EmptyString = tl::internName("''");
    Names.EmptyUnicode = tl::internName("u''");
    Names.EmptyBrackets = tl::internName("[]");
    Names.EmptyBraces = tl::internName("{}");
    Names.EmptyParens = tl::internName("( )");
    Names.Power = tl::internName("**");
    Ref SymbolInfo = tl::require(PyImport_ImportModule("pysource.symbolinfo"));
    Names.JoinTokens = tl::require(PyObject_GetAttrString(SymbolInfo.get(), "JoinTokens")).release();

    tl::TypeDesc D;
    D.Name = "pysource.treelens.CNodeToTextConverter";
    D.Doc = "CNodeToTextConverter(include_bracket_text=False, include_string_contents=False, "
            "include_arg_text=False)\n\n"
            "Renders expression nodes back to source text: names, dotted names, calls, subscripts and "
            "literals, and with include_bracket_text the contents of brackets and composite expressions.";
    D.Size = sizeof(ConverterObject);
    D.Methods = ConverterMethods;
    D.Init = converter_init;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(ConverterType, D));
    tl::requireStatus(tl::addType(Module, "CNodeToTextConverter", ConverterType));
    using F = tl::FieldKind;
    tl::registerPickle(ConverterType,
                       {{"_fIncludeBracketText", F::Bool, offsetof(ConverterObject, IncludeBracketText)},
                        {"_fIncludeStringContents", F::Bool, offsetof(ConverterObject, IncludeStringContents)},
                        {"_fIncludeArgText", F::Bool, offsetof(ConverterObject, IncludeArgText)}},
                       host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace treelens
