// Building logical-line records natively: the token arrays and the record allocator.
#ifndef TREELENS_FASTACCESS_RECORDS_H
#define TREELENS_FASTACCESS_RECORDS_H

#include "pysource/_fastaccess/internal.h"

#include <new>

namespace fastaccess {

/// The token arrays of one record in a single block: Count text pointers,
/// then Count positions, then Count type codes. Owns the texts until moveInto.
class TokenArrays {
public:
  explicit TokenArrays(Py_ssize_t N);
  ~TokenArrays();
  TokenArrays(const TokenArrays &) = delete;
  TokenArrays &operator=(const TokenArrays &) = delete;

  /// Stores token I; steals Text.
  void set(Py_ssize_t I, tl::Ref Text, TokenPos Pos, uint8_t Type) {
    Block[I] = Text.release();
    positions()[I] = Pos;
    types()[I] = Type;
  }
  /// Hands the arrays to a record whose own arrays are already freed.
  void moveInto(LogicalLineObject *L);

private:
  TokenPos *positions() { return reinterpret_cast<TokenPos *>(Block + Count); }
  uint8_t *types() { return reinterpret_cast<uint8_t *>(positions() + Count); }

  PyObject **Block = nullptr;
  Py_ssize_t Count;
};

/// Frees the records kept for reuse; returns how many there were.
TL_HIDDEN int clearLogicalFreeList();

/// New reference: an exact CLogicalLine taking A's tokens; steals LineText.
TL_HIDDEN LogicalLineObject *newLogical(TokenArrays &A, int Kind, long FirstLine, long Indent,
                                        tl::Ref LineText);

} // namespace fastaccess

#endif
