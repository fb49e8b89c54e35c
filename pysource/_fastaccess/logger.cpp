// CLogger: a small logger that forwards to the `logging` logger "pysource".
#include "pysource/_fastaccess/internal.h"

#include "typedesc.h"

namespace fastaccess {

using tl::guard;
using tl::Ref;
using tl::require;

PyTypeObject LoggerType = {PyVarObject_HEAD_INIT(nullptr, 0)};

namespace {

struct LoggerObject {
  PyObject_HEAD
  PyObject *Logger; ///< the logging.Logger, owned
};

LoggerObject *logself(PyObject *O) { return reinterpret_cast<LoggerObject *>(O); }

// CLogger(name=None): logs to "pysource", or to "pysource.<name>".
int logger_init(PyObject *O, PyObject *Args, PyObject *Kwds) {
  return guard(-1, [&] {
    static const char *Names[] = {"name", nullptr};
    const char *Name = nullptr;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "|z:CLogger", const_cast<char **>(Names), &Name))
      return -1;
    Ref Logging = require(PyImport_ImportModule("logging"));
    Ref Full = Name && *Name ? require(PyString_FromFormat("pysource.%s", Name))
                             : require(PyString_FromString("pysource"));
    Ref Logger = require(PyObject_CallMethod(Logging.get(), const_cast<char *>("getLogger"),
                                             const_cast<char *>("O"), Full.get()));
    Py_XSETREF(logself(O)->Logger, Logger.release());
    return 0;
  });
}

int logger_traverse(PyObject *O, visitproc visit, void *arg) {
  Py_VISIT(logself(O)->Logger);
  return 0;
}

int logger_clear(PyObject *O) {
  Py_CLEAR(logself(O)->Logger);
  return 0;
}

void logger_dealloc(PyObject *O) {
  PyObject_GC_UnTrack(O);
  logger_clear(O);
  Py_TYPE(O)->tp_free(O);
}

/// Calls the logger's method Name with the same arguments.
template <const char *Name> PyObject *forward(PyObject *O, PyObject *Args, PyObject *Kwds) {
  return guard<PyObject *>(nullptr, [&] {
    if (!logself(O)->Logger)
      tl::raise(PyExc_RuntimeError, msg::LoggerUnset);
    Ref Method = require(PyObject_GetAttrString(logself(O)->Logger, Name));
    return require(PyObject_Call(Method.get(), Args, Kwds)).release();
  });
}

constexpr char kDebug[] = "debug";
constexpr char kInfo[] = "info";
constexpr char kWarning[] = "warning";
constexpr char kError[] = "error";
constexpr char kException[] = "exception";
constexpr char kLog[] = "log";

#define TL_FORWARD(N, Doc)                                                                        \
  {N, reinterpret_cast<PyCFunction>(reinterpret_cast<void (*)()>(forward<N>)),             \
   METH_VARARGS | METH_KEYWORDS, Doc}

PyMethodDef Methods[] = {
    TL_FORWARD(kDebug, "debug(msg, *args)"),
    TL_FORWARD(kInfo, "info(msg, *args)"),
    TL_FORWARD(kWarning, "warning(msg, *args)"),
    TL_FORWARD(kError, "error(msg, *args)"),
    TL_FORWARD(kException, "exception(msg, *args): error with the current traceback"),
    TL_FORWARD(kLog, "log(level, msg, *args)"),
    {nullptr, nullptr, 0, nullptr}};

PyObject *get_logger(PyObject *O, void *) {
  PyObject *L = logself(O)->Logger ? logself(O)->Logger : Py_None;
  Py_INCREF(L);
  return L;
}

PyGetSetDef GetSets[] = {{const_cast<char *>("logger"), get_logger, nullptr,
                          const_cast<char *>("the logging.Logger written to"), nullptr},
                         {nullptr, nullptr, nullptr, nullptr, nullptr}};

} // namespace

int initLoggerType() {
  tl::TypeDesc D;
  D.Name = "pysource._fastaccess.CLogger";
  D.Doc = "CLogger(name=None)\n\n"
          "Writes to the logging logger \"pysource\" (or \"pysource.<name>\"), so a\n"
          "host redirects the native modules' messages with logging's own tools.";
  D.Size = sizeof(LoggerObject);
  D.Methods = Methods;
  D.GetSets = GetSets;
  D.Init = logger_init;
  D.New = PyType_GenericNew;
  D.Dealloc = logger_dealloc;
  D.Traverse = logger_traverse;
  D.Clear = logger_clear;
  return tl::readyType(LoggerType, D);
}

} // namespace fastaccess
