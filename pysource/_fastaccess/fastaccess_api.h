// The native interface of pysource._fastaccess used by the other native modules.
//
// The record layout below is shared: other modules read a record's fields
// directly after an exact type test against Api->LogicalLineType. The
// operations that change a record or need the module's state go through the
// function table, published as the capsule "pysource._fastaccess._C_API".
// Import it once with importFastAccessApi().
#ifndef TREELENS_FASTACCESS_API_H
#define TREELENS_FASTACCESS_API_H

#include <Python.h>
#include <stdint.h>

namespace fastaccess {

/// Position of one token: Row 0 is the logical's first physical line; Col is a byte offset.
struct TokenPos {
  int32_t Row;
  int32_t Col;
};

/// Flag bits of LogicalLineObject::Flags.
/// kFlagTruncated: a walk of the record stopped at its limits, so the derived
/// info holds only what was recorded up to there; cleared with the derived info.
enum : uint8_t { kFlagInspected = 1, kFlagTruncated = 2 };

/// A logical-line record. Invariant: Texts[0..TokenCount) are byte strings
/// (owned), Types[i] == token type code of Texts[i], Positions[i] its position.
/// The one contextual type: a backslash that does not end its line is 201.
struct LogicalLineObject {
  PyObject_HEAD
  PyObject **Texts;        ///< owned byte strings, TokenCount of them
  TokenPos *Positions;     ///< TokenCount positions
  uint8_t *Types;          ///< TokenCount token type codes
  Py_ssize_t TokenCount;
  int32_t Kind;
  uint8_t Flags;
  long FirstLine;
  long Indent;
  PyObject *LineText;          ///< bytes, owned
  PyObject *ParentScope;       ///< owned or NULL (unset)
  PyObject *LocalScopeDefined; ///< owned or NULL (unset)
  // The derived-info lists are private to the record: only the Api
  // operations and the record's methods append to them, and only exact
  // bytes and (bytes, bytes) tuples, so the collector need not track them.
  // Python code sees copies.
  PyObject *NamesDefined;      ///< list or NULL until first append
  PyObject *TypeEquivs;        ///< list of (name, info) or NULL
  PyObject *ArgNames;          ///< list or NULL
  PyObject *ArgTypeEquivs;     ///< list of (name, info) or NULL
  PyObject *BaseClassNames;    ///< list or NULL
  PyObject *TokensView;        ///< cached fTokens tuple or NULL
  PyObject *Dict;              ///< instance dict, or NULL
  PyObject *WeakRefs;
  LogicalLineObject *UntrackedPrev; ///< links of the records the collector does not track
  LogicalLineObject *UntrackedNext; ///< (NULL when tracked)
};

/// Function table of the capsule. Every function that can fail returns -1 or
/// NULL with a Python exception set.
struct Api {
  int Version;
  PyTypeObject *LogicalLineType;
  /// Token type code of a token text (same as GetTokenType).
  int (*TokenTypeOfText)(const char *Text, Py_ssize_t Len);
  /// Empties the derived-info lists of a record.
  int (*ClearDerivedInfo)(PyObject *Logical);
  /// Records an assigned name, or the name of a (name, info) pair.
  int (*AppendAttrib)(PyObject *Logical, PyObject *Attrib);
  /// Appends (Name, Info) to fTypeEquivs.
  int (*AppendTypeEquiv)(PyObject *Logical, PyObject *Name, PyObject *Info);
  /// New reference: list of token texts of Text (no NEWLINE/INDENT/DEDENT).
  PyObject *(*Tokenize)(const char *Text, Py_ssize_t Len);
  /// New reference: list of the logical-line records of Text, parents linked.
  PyObject *(*SplitLogicals)(const char *Text, Py_ssize_t Len);
};

constexpr int kApiVersion = 1;
constexpr const char *kCapsuleName = "pysource._fastaccess._C_API";

/// Imports the module and returns its table; NULL with an exception on failure.
inline const Api *importFastAccessApi() {
  void *P = PyCapsule_Import(const_cast<char *>(kCapsuleName), 0);
  if (!P)
    return nullptr;
  const Api *A = static_cast<const Api *>(P);
  if (A->Version != kApiVersion) {
    PyErr_SetString(PyExc_ImportError, "pysource._fastaccess: API version mismatch");
    return nullptr;
  }
  return A;
}

} // namespace fastaccess

#endif
