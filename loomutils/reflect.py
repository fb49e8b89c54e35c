"""Reporting of unexpected exceptions.

ReportCurrentException writes the traceback of the exception being handled to
the logging logger "pysource", at level ERROR, so that a host can send it
wherever it wants by configuring that logger. When no handler anywhere on the
logger's path would receive the record, the traceback goes to standard error
instead, so it is never lost silently.
"""

import logging
import sys
import traceback

kLoggerName = 'pysource'


def _HasHandler(logger):
    while logger is not None:
        if logger.handlers:
            return True
        if not logger.propagate:
            return False
        logger = logger.parent
    return False


def ReportCurrentException(suppress_gui=False, exc_info=None):
    """Reports the exception being handled (or exc_info, a sys.exc_info()
    triple). Never raises.

    This host has no GUI; suppress_gui is accepted so that callers written
    for hosts that show error dialogs work unchanged.
    """
    try:
        if exc_info is None:
            exc_info = sys.exc_info()
        if exc_info[0] is None:
            return
        logger = logging.getLogger(kLoggerName)
        if _HasHandler(logger):
            logger.error('Unexpected exception', exc_info=exc_info)
        else:
            sys.stderr.write('Unexpected exception\n' + ''.join(
                traceback.format_exception(*exc_info)))
    except Exception:
        pass
