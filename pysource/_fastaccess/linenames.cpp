// Where a record's defined and read names are: the columns of the line view.
#include "pysource/_fastaccess/linetable.h"

#include <string_view>
#include <vector>

namespace fastaccess {

using tl::Ref;
using tl::require;

namespace {

std::string_view viewOf(PyObject *T) {
  return T ? std::string_view(PyString_AS_STRING(T), static_cast<size_t>(PyString_GET_SIZE(T)))
           : std::string_view();
}

/// The names of a sequence argument, each bytes; throws TypeError otherwise.
std::vector<std::string_view> namesOf(PyObject *Seq, Ref &Keep) {
  constexpr const char *Message = "names must be a sequence of bytes";
  if (PyString_Check(Seq) || PyUnicode_Check(Seq))
    tl::raise(PyExc_TypeError, Message); // not the characters of one name
  Keep = require(PySequence_Fast(Seq, Message));
  std::vector<std::string_view> Out;
  for (Py_ssize_t I = 0, N = PySequence_Fast_GET_SIZE(Keep.get()); I < N; ++I) {
    PyObject *Item = PySequence_Fast_GET_ITEM(Keep.get(), I);
    expectBytes(Item);
    Out.push_back(viewOf(Item));
  }
  return Out;
}

class Columns {
public:
  explicit Columns(LogicalLineObject *L) : L(L), First(L->FirstLine + 1) {
    Texts.reserve(static_cast<size_t>(L->TokenCount));
    for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
      Texts.push_back(viewOf(L->Texts[I]));
      Present.push_back(L->Texts[I] != nullptr);
    }
    Taken.assign(Texts.size(), false);
  }

  /// Index of the first occurrence of Name at or after From not after a dot, or -1.
  long next(std::string_view Name, long From) const {
    for (long I = From, N = static_cast<long>(Texts.size()); I < N; ++I)
      if (Present[I] && Texts[I] == Name && (I == 0 || Texts[I - 1] != "."))
        return I;
    return -1;
  }

  long define(std::string_view Name) {
    long I = next(Name, 0);
    if (I >= 0)
      Taken[I] = true;
    return I;
  }

  /// A read name (dotted or not): its first occurrence no defined name took,
  /// else its first occurrence, else the first string token holding its head.
  long read(std::string_view Name) const {
    std::vector<std::string_view> Parts;
    for (size_t Start = 0;;) {
      size_t Dot = Name.find('.', Start);
      Parts.push_back(Name.substr(Start, Dot == std::string_view::npos ? Dot : Dot - Start));
      if (Dot == std::string_view::npos)
        break;
      Start = Dot + 1;
    }
    const long N = static_cast<long>(Texts.size());
    long Found = -1;
    for (long I = next(Parts[0], 0); I >= 0; I = next(Parts[0], I + 1)) {
      bool Chain = true;
      for (size_t K = 1; K < Parts.size() && Chain; ++K) {
        long At = I + 2 * static_cast<long>(K);
        Chain = At < N && Texts[At - 1] == "." && Texts[At] == Parts[K];
      }
      if (!Chain)
        continue;
      if (!Taken[I])
        return I;
      if (Found < 0)
        Found = I;
    }
    if (Found >= 0)
      return Found;
    for (long I = 0; I < N; ++I) {
      std::string_view T = Texts[I];
      if (Present[I] && (T.empty() || T.back() == '\'' || T.back() == '"') &&
          T.find(Parts[0]) != std::string_view::npos)
        return I;
    }
    return -1;
  }

  Ref position(long I) const {
    if (I < 0)
      return Ref::borrow(Py_None);
    return require(Py_BuildValue("(ll)", First + L->Positions[I].Row, L->Positions[I].Col + 1L));
  }

private:
  LogicalLineObject *L;
  long First;
  std::vector<std::string_view> Texts;
  std::vector<bool> Present;
  std::vector<bool> Taken;
};

} // namespace

Ref lineNameColumns(PyObject *Logical, PyObject *Defines, PyObject *Reads) {
  LogicalLineObject *L = asLogical(Logical);
  Ref KeepDefines, KeepReads;
  std::vector<std::string_view> DefineNames = namesOf(Defines, KeepDefines);
  std::vector<std::string_view> ReadNames = namesOf(Reads, KeepReads);
  Columns C(L);
  Ref DefinesAt = require(PyList_New(static_cast<Py_ssize_t>(DefineNames.size())));
  for (size_t K = 0; K < DefineNames.size(); ++K)
    PyList_SET_ITEM(DefinesAt.get(), static_cast<Py_ssize_t>(K),
                    C.position(C.define(DefineNames[K])).release());
  Ref ReadsAt = require(PyList_New(static_cast<Py_ssize_t>(ReadNames.size())));
  for (size_t K = 0; K < ReadNames.size(); ++K)
    PyList_SET_ITEM(ReadsAt.get(), static_cast<Py_ssize_t>(K),
                    C.position(C.read(ReadNames[K])).release());
  return require(PyTuple_Pack(2, DefinesAt.get(), ReadsAt.get()));
}

} // namespace fastaccess
