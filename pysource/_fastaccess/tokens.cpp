// Token texts as bytes objects, Tokenize, the native splitter and the CBytesTokenizer type.
#include "pysource/_fastaccess/internal.h"
#include "pysource/_fastaccess/records.h"

#include "tokenize/splitter.h"
#include "typedesc.h"

#include <cstring>
#include <vector>

namespace fastaccess {

using tl::guard;
using tl::Ref;
using tl::require;
using tokcore::TokenKind;

PyTypeObject BytesTokenizerType = {PyVarObject_HEAD_INIT(nullptr, 0)};

namespace {

// ---- shared texts of keywords and multi-byte operators

/// Open-addressing table keyed by the text's bytes (at most 8) and length.
/// Invariant: filled once at import, read-only afterwards.
struct CachedText {
  uint64_t Key;
  size_t Len;
  PyObject *Text;
};
constexpr size_t kCacheSlots = 512;
CachedText Cache[kCacheSlots];

uint64_t packKey(const char *Text, size_t Len) {
  uint64_t K = 0;
  std::memcpy(&K, Text, Len);
  return K;
}

size_t slotOf(uint64_t Key, size_t Len) {
  return static_cast<size_t>(((Key ^ Len) * 0x9E3779B97F4A7C15ull) >> 55) & (kCacheSlots - 1);
}

/// The one-byte texts, shared by every split. Filled at import.
PyObject *CharTexts[256];

const char *const kSharedTexts[] = {
    // Keywords of Python 2 and 3, and names nearly every file uses.
    "and", "as", "assert", "async", "await", "break", "class", "continue", "def", "del", "elif",
    "else", "except", "exec", "finally", "for", "from", "global", "if", "import", "in", "is",
    "lambda", "nonlocal", "not", "or", "pass", "print", "raise", "return", "try", "while",
    "with", "yield", "True", "False", "None", "self", "cls", "len", "str", "int", "object",
    "append", "name", "value", "args", "kwargs", "__init__", "__name__",
    // Operators of two and three bytes.
    "==", "!=", "<>", "<=", ">=", "<<", ">>", "**", "+=", "-=", "*=", "/=", "%=", "&=", "|=",
    "^=", "<<=", ">>=", "**=", "//", "//=", "@=", "->", "...", ":="};

} // namespace

int initTokenTextCache() {
  return guard(-1, [] {
    for (int C = 0; C < 256; ++C) {
      char Byte = static_cast<char>(C);
      CharTexts[C] = require(PyString_FromStringAndSize(&Byte, 1)).release();
    }
    for (const char *T : kSharedTexts) {
      size_t Len = std::strlen(T);
      if (Len > 8) // the key holds 8 bytes
        continue;
      uint64_t Key = packKey(T, Len);
      size_t S = slotOf(Key, Len);
      while (Cache[S].Text && !(Cache[S].Key == Key && Cache[S].Len == Len))
        S = (S + 1) & (kCacheSlots - 1);
      if (Cache[S].Text)
        continue;
      PyObject *Text = require(PyString_FromStringAndSize(T, static_cast<Py_ssize_t>(Len))).release();
      PyString_InternInPlace(&Text);
      Cache[S] = {Key, Len, Text};
    }
    return 0;
  });
}

Ref tokenText(const char *Text, size_t Len, TokenKind Kind) {
  if (Len == 1)
    return Ref::borrow(CharTexts[static_cast<unsigned char>(Text[0])]);
  if (Len >= 2 && Len <= 8 && Kind != TokenKind::STRING && Kind != TokenKind::NUMBER &&
      Kind != TokenKind::COMMENT) {
    uint64_t Key = packKey(Text, Len);
    for (size_t S = slotOf(Key, Len); Cache[S].Text; S = (S + 1) & (kCacheSlots - 1))
      if (Cache[S].Key == Key && Cache[S].Len == Len)
        return Ref::borrow(Cache[S].Text);
  }
  return require(PyString_FromStringAndSize(Text, static_cast<Py_ssize_t>(Len)));
}

void raiseStatus(tokcore::TokStatus Status) {
  if (Status == tokcore::TokStatus::NoMemory) {
    PyErr_NoMemory();
    throw tl::PyErrSet();
  }
  tl::raise(PyExc_ValueError, msg::TooLarge);
}

int tokenTypeOfText(const char *Text, Py_ssize_t Len) {
  return static_cast<int>(tokcore::classifyText(Text, static_cast<size_t>(Len)));
}

PyObject *tokenizeText(const char *Text, Py_ssize_t Size) {
  return guard<PyObject *>(nullptr, [&] {
    size_t Len = static_cast<size_t>(Size);
    Ref List = require(PyList_New(0));
    tokcore::Lexer L(Text, Len, tokcore::bomLength(Text, Len));
    while (!L.atEnd()) {
      L.skipBlanks();
      if (L.atLineEnd()) {
        L.consumeLineEnd();
        continue;
      }
      tokcore::Token T;
      L.scan(T);
      Ref Item = tokenText(Text + T.Start, T.End - T.Start, T.Type);
      tl::requireStatus(PyList_Append(List.get(), Item.get()));
    }
    return List.release();
  });
}

namespace {

/// Shares one bytes object among equal token texts of one split, so a name
/// used a hundred times costs one allocation. Open addressing on the text's
/// hash. Invariant: Used < Slots.size() / 2; every non-null Text is owned.
class TextInterner {
public:
  ~TextInterner() { clear(); }

  /// New reference: the shared text for Text[0..Len).
  Ref get(const char *Text, size_t Len, TokenKind Kind) {
    if (Len < 2 || Len > kMaxLen || Kind == TokenKind::COMMENT)
      return tokenText(Text, Len, Kind);
    if (Used * 2 >= Slots.size())
      grow();
    uint64_t H = hash(Text, Len);
    size_t Mask = Slots.size() - 1;
    for (size_t I = static_cast<size_t>(H) & Mask;; I = (I + 1) & Mask) {
      Slot &S = Slots[I];
      if (!S.Text) {
        Ref New = tokenText(Text, Len, Kind);
        S = {H, Ref::borrow(New.get()).release()};
        Filled.push_back(I);
        ++Used;
        return New;
      }
      if (S.Hash == H && static_cast<size_t>(PyString_GET_SIZE(S.Text)) == Len &&
          std::memcmp(PyString_AS_STRING(S.Text), Text, Len) == 0)
        return Ref::borrow(S.Text);
    }
  }

  /// Drops the shared texts; keeps a modest table for the next split. Costs
  /// the texts held, not the table size: a short split follows a long one.
  void clear() {
    for (size_t I : Filled)
      Py_CLEAR(Slots[I].Text);
    Filled.clear();
    if (Slots.size() > kKeepSlots)
      std::vector<Slot>().swap(Slots);
    Used = 0;
  }

private:
  static constexpr size_t kMaxLen = 32;
  static constexpr size_t kKeepSlots = 1 << 14;
  struct Slot {
    uint64_t Hash;
    PyObject *Text;
  };

  static uint64_t hash(const char *Text, size_t Len) {
    uint64_t H = Len * 0x9E3779B97F4A7C15ull;
    for (; Len >= 8; Text += 8, Len -= 8) {
      uint64_t W;
      std::memcpy(&W, Text, 8);
      H = (H ^ W) * 0xff51afd7ed558ccdull;
      H ^= H >> 32;
    }
    if (Len) {
      uint64_t W = 0;
      std::memcpy(&W, Text, Len);
      H = (H ^ W) * 0xff51afd7ed558ccdull;
    }
    return H ^ (H >> 29);
  }

  void grow() {
    std::vector<Slot> Old;
    Old.swap(Slots);
    Slots.assign(Old.empty() ? 1024 : Old.size() * 2, Slot{0, nullptr});
    size_t Mask = Slots.size() - 1;
    Filled.clear();
    for (const Slot &S : Old) {
      if (!S.Text)
        continue;
      size_t I = static_cast<size_t>(S.Hash) & Mask;
      while (Slots[I].Text)
        I = (I + 1) & Mask;
      Slots[I] = S;
      Filled.push_back(I);
    }
  }

  std::vector<Slot> Slots;
  std::vector<size_t> Filled; ///< indices of the slots that hold a text
  size_t Used = 0;
};

/// Working memory of one split, reused by the next one to spare the allocator.
struct SplitScratch {
  tokcore::SplitResult Result;
  TextInterner Texts;
  bool InUse = false;
};

SplitScratch SharedScratch;

/// Claims the shared scratch, or a private one when a split is already
/// running (a collection can run Python code in the middle of one).
class ScratchLease {
public:
  ScratchLease() : S(SharedScratch.InUse ? &Own : &SharedScratch) { S->InUse = true; }
  ~ScratchLease() {
    S->Texts.clear();
    constexpr size_t kKeepTokens = 1 << 20;
    if (S->Result.Tokens.capacity() > kKeepTokens) {
      std::vector<tokcore::SplitToken>().swap(S->Result.Tokens);
      std::vector<tokcore::SplitLogical>().swap(S->Result.Logicals);
    }
    S->InUse = false;
  }
  SplitScratch &operator*() { return *S; }

private:
  SplitScratch Own;
  SplitScratch *S;
};

} // namespace

PyObject *splitText(const char *Text, Py_ssize_t Size) {
  return guard<PyObject *>(nullptr, [&] {
    ScratchLease Lease;
    tokcore::SplitResult &R = (*Lease).Result;
    TextInterner &Texts = (*Lease).Texts;
    tokcore::TokStatus Status = tokcore::splitLogicals(Text, static_cast<size_t>(Size), R);
    if (Status != tokcore::TokStatus::OK)
      raiseStatus(Status);
    Py_ssize_t N = static_cast<Py_ssize_t>(R.Logicals.size());
    Ref List = require(PyList_New(N));
    for (Py_ssize_t I = 0; I < N; ++I) {
      const tokcore::SplitLogical &G = R.Logicals[static_cast<size_t>(I)];
      TokenArrays A(static_cast<Py_ssize_t>(G.TokenCount));
      for (size_t J = 0; J < G.TokenCount; ++J) {
        const tokcore::SplitToken &T = R.Tokens[G.FirstToken + J];
        A.set(static_cast<Py_ssize_t>(J), Texts.get(Text + T.Start, T.End - T.Start, T.Type),
              TokenPos{T.Row, T.Col}, static_cast<uint8_t>(T.Type));
      }
      Ref LineText = require(PyString_FromStringAndSize(
          Text + G.TextStart, static_cast<Py_ssize_t>(G.TextEnd - G.TextStart)));
      LogicalLineObject *L = newLogical(A, G.Kind, G.FirstLine, G.Indent, std::move(LineText));
      if (G.Parent >= 0) {
        L->ParentScope = PyList_GET_ITEM(List.get(), G.Parent);
        Py_INCREF(L->ParentScope);
      }
      PyList_SET_ITEM(List.get(), I, reinterpret_cast<PyObject *>(L));
    }
    return List.release();
  });
}

// ---- CBytesTokenizer

namespace {

/// Iterator over the tokens of a byte string. Invariant: Lex points into
/// Text's buffer, which Text keeps alive.
struct BytesTokenizerObject {
  PyObject_HEAD
  PyObject *Text;
  tokcore::Lexer Lex;
};

BytesTokenizerObject *tokself(PyObject *O) { return reinterpret_cast<BytesTokenizerObject *>(O); }

PyObject *tokenizer_new(PyTypeObject *Type, PyObject *Args, PyObject *Kwds) {
  static const char *Names[] = {"text", nullptr};
  PyObject *Text;
  if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "S:CBytesTokenizer", const_cast<char **>(Names),
                                   &Text))
    return nullptr;
  PyObject *O = Type->tp_alloc(Type, 0);
  if (!O)
    return nullptr;
  BytesTokenizerObject *T = tokself(O);
  Py_INCREF(Text);
  T->Text = Text;
  const char *Buf = PyString_AS_STRING(Text);
  size_t Len = static_cast<size_t>(PyString_GET_SIZE(Text));
  new (&T->Lex) tokcore::Lexer(Buf, Len, tokcore::bomLength(Buf, Len));
  return O;
}

void tokenizer_dealloc(PyObject *O) {
  Py_CLEAR(tokself(O)->Text);
  Py_TYPE(O)->tp_free(O);
}

PyObject *tokenizer_iter(PyObject *O) {
  Py_INCREF(O);
  return O;
}

PyObject *tokenizer_next(PyObject *O) {
  tokcore::Lexer &L = tokself(O)->Lex;
  while (!L.atEnd()) {
    L.skipBlanks();
    if (L.atLineEnd()) {
      L.consumeLineEnd();
      continue;
    }
    tokcore::Token T;
    L.scan(T);
    return guard<PyObject *>(nullptr, [&] {
      Ref Text = tokenText(L.Buf + T.Start, T.End - T.Start, T.Type);
      return require(Py_BuildValue("iO(nn)", static_cast<int>(T.Type), Text.get(),
                                   static_cast<Py_ssize_t>(T.Line),
                                   static_cast<Py_ssize_t>(T.Col)))
          .release();
    });
  }
  return nullptr;
}

} // namespace

int initBytesTokenizerType() {
  tl::TypeDesc D;
  D.Name = "pysource._fastaccess.CBytesTokenizer";
  D.Doc = "CBytesTokenizer(text)\n\n"
          "Iterates the tokens of a byte string as (type, text, (line, col)): line is\n"
          "0-based in the whole text, col a byte offset in that line. Comments (202)\n"
          "and continuation backslashes (203) are tokens; line ends, indentation and\n"
          "a leading UTF-8 byte-order mark are not.";
  D.Size = sizeof(BytesTokenizerObject);
  D.Flags = Py_TPFLAGS_DEFAULT;
  D.New = tokenizer_new;
  D.Dealloc = tokenizer_dealloc;
  D.Iter = tokenizer_iter;
  D.IterNext = tokenizer_next;
  return tl::readyType(BytesTokenizerType, D);
}

} // namespace fastaccess
