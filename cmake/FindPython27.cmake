# Locates a CPython 2.7 interpreter and its headers.
#
# Search order: -DPYTHON2=<path>, $PYTHON2, $PYENV_ROOT/versions/2.7*/bin/python2.7,
# ~/.pyenv/versions/2.7*/bin/python2.7, python2.7 on PATH. A candidate counts
# only when it runs and reports version 2.7 (a pyenv shim without an active
# 2.7 fails that test). Sets PYTHON27_EXECUTABLE, PYTHON27_INCLUDE_DIR.

set(_candidates)
if(PYTHON2)
  list(APPEND _candidates "${PYTHON2}")
endif()
if(DEFINED ENV{PYTHON2})
  list(APPEND _candidates "$ENV{PYTHON2}")
endif()
set(_roots)
if(DEFINED ENV{PYENV_ROOT})
  list(APPEND _roots "$ENV{PYENV_ROOT}")
endif()
if(DEFINED ENV{HOME})
  list(APPEND _roots "$ENV{HOME}/.pyenv")
endif()
list(APPEND _roots "/root/.pyenv")
foreach(_root IN LISTS _roots)
  file(GLOB _found "${_root}/versions/2.7*/bin/python2.7")
  list(SORT _found)
  list(REVERSE _found)
  list(APPEND _candidates ${_found})
endforeach()
find_program(_path_python27 NAMES python2.7 python2)
if(_path_python27)
  list(APPEND _candidates "${_path_python27}")
endif()

set(PYTHON27_EXECUTABLE "")
foreach(_cand IN LISTS _candidates)
  execute_process(
    COMMAND "${_cand}" -c "import sys, sysconfig; sys.stdout.write('%d.%d;%s' % (sys.version_info[0], sys.version_info[1], sysconfig.get_paths()['include']))"
    OUTPUT_VARIABLE _out RESULT_VARIABLE _rc ERROR_QUIET)
  if(_rc EQUAL 0)
    list(GET _out 0 _ver)
    if(_ver STREQUAL "2.7")
      list(GET _out 1 _inc)
      if(EXISTS "${_inc}/Python.h")
        set(PYTHON27_EXECUTABLE "${_cand}")
        set(PYTHON27_INCLUDE_DIR "${_inc}")
        break()
      endif()
    endif()
  endif()
endforeach()

if(NOT PYTHON27_EXECUTABLE)
  message(FATAL_ERROR
    "No CPython 2.7 interpreter with headers was found.\n"
    "Looked at: ${_candidates}\n"
    "Install Python 2.7.18 (for example with pyenv) or pass -DPYTHON2=/path/to/python2.7.")
endif()
message(STATUS "Python 2.7: ${PYTHON27_EXECUTABLE} (headers ${PYTHON27_INCLUDE_DIR})")
