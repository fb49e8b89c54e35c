// Owning reference handle, error latch and exception guard shared by the native modules.
#ifndef TREELENS_COMMON_PYREF_H
#define TREELENS_COMMON_PYREF_H

#include <Python.h>

#include <new>
#include <stdexcept>
#include <utility>

#if defined(__GNUC__)
#define TL_HIDDEN __attribute__((visibility("hidden")))
#else
#define TL_HIDDEN
#endif

namespace tl {

/// Move-only owner of one strong reference (or none).
class Ref {
public:
  Ref() = default;
  /// Takes over a new reference.
  static Ref steal(PyObject *O) { return Ref(O); }
  /// Adds a reference to a borrowed object.
  static Ref borrow(PyObject *O) {
    Py_XINCREF(O);
    return Ref(O);
  }
  Ref(Ref &&R) noexcept : Obj(R.release()) {}
  Ref &operator=(Ref R) noexcept {
    std::swap(Obj, R.Obj);
    return *this;
  }
  Ref(const Ref &) = delete;
  ~Ref() { Py_XDECREF(Obj); }
  /// Borrowed.
  PyObject *get() const { return Obj; }
  /// Hands the reference to the caller.
  PyObject *release() {
    PyObject *O = Obj;
    Obj = nullptr;
    return O;
  }
  explicit operator bool() const { return Obj != nullptr; }

private:
  explicit Ref(PyObject *O) : Obj(O) {}
  PyObject *Obj = nullptr;
};

/// Thrown when a Python error is already set.
struct PyErrSet {};

/// Throws PyErrSet for a NULL result; returns the new reference otherwise.
inline Ref require(PyObject *O) {
  if (!O)
    throw PyErrSet();
  return Ref::steal(O);
}

/// Throws PyErrSet for a -1 status.
inline int requireStatus(int Status) {
  if (Status == -1)
    throw PyErrSet();
  return Status;
}

/// Python truth of O; throws PyErrSet when the test raises.
inline bool isTrue(PyObject *O) { return requireStatus(PyObject_IsTrue(O)) != 0; }

/// Sets a Python exception and throws PyErrSet.
[[noreturn]] inline void raise(PyObject *Type, const char *Message) {
  PyErr_SetString(Type, Message);
  throw PyErrSet();
}

/// Formats a Python exception and throws PyErrSet.
template <class... A>
[[noreturn]] void raiseFormat(PyObject *Type, const char *Format, A... Args) {
  PyErr_Format(Type, Format, Args...);
  throw PyErrSet();
}

/// Runs Body; turns any C++ exception into a Python error and returns OnError.
template <class R, class F> R guard(R OnError, F &&Body) noexcept {
  try {
    return Body();
  } catch (const PyErrSet &) {
  } catch (const std::bad_alloc &) {
    PyErr_NoMemory();
  } catch (const std::exception &E) {
    PyErr_SetString(PyExc_SystemError, E.what());
  } catch (...) {
    PyErr_SetString(PyExc_SystemError, "unknown C++ exception");
  }
  return OnError;
}

/// Raises TypeError "Expected <what>, got <type>" unless Ok.
inline void expectType(bool Ok, const char *What, PyObject *Got) {
  if (!Ok)
    raiseFormat(PyExc_TypeError, "Expected %.16s, got %.200s", What,
                Py_TYPE(Got)->tp_name);
}

/// Native levels a recursion over caller-reachable structure (node trees,
/// raw trees, chains of links) may nest in all; the parse engine's nesting
/// bound, so every tree the parser builds fits.
constexpr int MaxNativeNesting = 1500;

/// One level of such a recursion: RuntimeError past MaxNativeNesting levels,
/// so a deep or cyclic structure raises instead of overflowing the C stack,
/// whatever recursion limit the caller set. Where names the walk.
class NestingGuard {
public:
  explicit NestingGuard(const char *Where) {
    if (depth() >= MaxNativeNesting)
      raiseFormat(PyExc_RuntimeError, "maximum recursion depth exceeded %.100s", Where);
    ++depth();
  }
  ~NestingGuard() { --depth(); }
  NestingGuard(const NestingGuard &) = delete;
  NestingGuard &operator=(const NestingGuard &) = delete;

private:
  static int &depth() {
    static int Depth = 0;
    return Depth;
  }
};

} // namespace tl

#endif
