// EncodeStringLiteral of pysource.symbolinfo, natively: the walkers call it for every string literal
// they render. The Python version in symbolinfo.py stays as the reference.
#include "pysource/_fastaccess/literals.h"

#include <cstring>
#include <string>

namespace fastaccess {

namespace {

/// Text of a byte string, or of a unicode object as UTF-8 (Owner keeps it alive).
void bytesOf(PyObject *Value, tl::Ref &Owner, const char *&Data, Py_ssize_t &Size) {
  if (PyUnicode_Check(Value)) {
    Owner = tl::require(PyUnicode_AsUTF8String(Value));
    Value = Owner.get();
  } else if (!PyString_Check(Value)) {
    tl::raiseFormat(PyExc_TypeError, "Expected %.16s, got %.200s", "bytes", Py_TYPE(Value)->tp_name);
  }
  Data = PyString_AS_STRING(Value);
  Size = PyString_GET_SIZE(Value);
}

bool isLetter(unsigned char C) { return (C >= 'a' && C <= 'z') || (C >= 'A' && C <= 'Z'); }

/// Appends a literal body: ASCII letters, digits, "_" and "." and bytes from 0x80 up as they are,
/// every other byte as %XX.
void encodeBody(std::string &Out, const char *P, const char *End) {
  static const char Hex[] = "0123456789ABCDEF";
  for (; P < End; ++P) {
    unsigned char C = static_cast<unsigned char>(*P);
    if (isLetter(C) || (C >= '0' && C <= '9') || C == '_' || C == '.' || C >= 0x80) {
      Out += static_cast<char>(C);
    } else {
      Out += '%';
      Out += Hex[C >> 4];
      Out += Hex[C & 15];
    }
  }
}

std::string encodeStringLiteral(const char *Text, Py_ssize_t Size) {
  std::string Out;
  const char *End = Text + Size;
  const char *P = Text;
  while (P < End && isLetter(static_cast<unsigned char>(*P)))
    ++P;
  Py_ssize_t Letters = P - Text;
  bool Prefixed = Letters <= 2 && P < End && (*P == '\'' || *P == '"');
  for (const char *L = Text; Prefixed && L < P; ++L)
    Prefixed = std::strchr("uUbBfFrR", *L) != nullptr;
  if (!Prefixed) {
    encodeBody(Out, Text, End);
    return Out;
  }
  for (char Letter : {'u', 'b', 'f', 'r'})
    for (const char *L = Text; L < P; ++L)
      if ((*L | 0x20) == Letter) {
        Out += Letter;
        break;
      }
  Py_ssize_t QuoteLen = End - P >= 3 && P[1] == *P && P[2] == *P ? 3 : 1;
  const char *Body = P + QuoteLen;
  const char *BodyEnd = End;
  bool Closed = false;
  if (BodyEnd - Body >= QuoteLen && std::memcmp(BodyEnd - QuoteLen, P, QuoteLen) == 0) {
    const char *Inner = BodyEnd - QuoteLen;
    Py_ssize_t Slashes = 0;
    while (Inner - Slashes > Body && Inner[-1 - Slashes] == '\\')
      ++Slashes;
    Closed = Slashes % 2 == 0;
    if (Closed)
      BodyEnd = Inner;
  }
  Out += '\'';
  encodeBody(Out, Body, BodyEnd);
  if (Closed)
    Out += '\'';
  return Out;
}

} // namespace

PyObject *f_encode_string_literal(PyObject *, PyObject *Text) {
  return tl::guard<PyObject *>(nullptr, [&] {
    tl::Ref Owner;
    const char *Data;
    Py_ssize_t Size;
    bytesOf(Text, Owner, Data, Size);
    std::string Out = encodeStringLiteral(Data, Size);
    return PyString_FromStringAndSize(Out.data(), static_cast<Py_ssize_t>(Out.size()));
  });
}

} // namespace fastaccess
