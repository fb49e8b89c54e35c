"""Shared helpers of the Python test suite: corpora, oracle interpreters, sampling."""

import glob
import os
import random
import subprocess
import sys

kRoot = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
kSanitized = bool(os.environ.get('TREELENS_SANITIZED'))


def PyenvRoot():
    root = os.environ.get('PYENV_ROOT')
    if root and os.path.isdir(root):
        return root
    for cand in (os.path.expanduser('~/.pyenv'), '/root/.pyenv'):
        if os.path.isdir(cand):
            return cand
    return None


def Interpreter(version):
    """Path of the pyenv interpreter for 'X.Y', or None."""
    root = PyenvRoot()
    if root is None:
        return None
    found = sorted(glob.glob(os.path.join(root, 'versions', version + '.*', 'bin',
                                          'python' + version)))
    return found[-1] if found else None


def StdlibDir(version):
    """Folder of the standard library of pyenv's Python X.Y, or None."""
    if version == '2.7':
        import os as _os
        return _os.path.dirname(_os.__file__)
    interp = Interpreter(version)
    if interp is None:
        return None
    lib = os.path.join(os.path.dirname(os.path.dirname(interp)), 'lib',
                       'python' + version)
    return lib if os.path.isdir(lib) else None


def CorpusFiles(version, limit=None, seed=1234):
    """Sorted .py files of a standard library; sampled down to `limit` files.

    The limit defaults to $TREELENS_CORPUS_LIMIT, or 150 under the sanitizer
    build, or all files.
    """
    lib = StdlibDir(version)
    if lib is None:
        return []
    files = []
    for dirpath, dirnames, filenames in os.walk(lib):
        dirnames[:] = sorted(d for d in dirnames if d != 'site-packages')
        for name in sorted(filenames):
            if name.endswith('.py'):
                files.append(os.path.join(dirpath, name))
    if limit is None:
        env = os.environ.get('TREELENS_CORPUS_LIMIT')
        if env:
            limit = int(env)
        elif kSanitized:
            limit = 150
    if limit is not None and len(files) > limit:
        rnd = random.Random(seed)
        files = sorted(rnd.sample(files, limit))
    return files


def StubFiles(limit=None, seed=1234):
    """Sorted typeshed .pyi files fetched by tools/fetch-stubs.sh, sampled down to `limit` files.

    The limit defaults to $TREELENS_STUB_LIMIT (0 for all), or 150 under the sanitizer build, or 1500.
    """
    root = os.environ.get('TREELENS_STUBS') or os.path.join(
        os.environ.get('XDG_CACHE_HOME') or os.path.expanduser('~/.cache'), 'treelens', 'stubs')
    files = []
    for dirpath, dirnames, filenames in os.walk(os.path.join(root, 'typeshed-fallback')):
        dirnames.sort()
        files.extend(os.path.join(dirpath, n) for n in sorted(filenames) if n.endswith('.pyi'))
    if limit is None:
        limit = int(os.environ.get('TREELENS_STUB_LIMIT') or (150 if kSanitized else 1500))
    if limit and len(files) > limit:
        files = sorted(random.Random(seed).sample(files, limit))
    return files


def InAsyncDef(logical):
    """The host's rule (pysource.utils.InAsyncDef): inside an async def body, at any depth."""
    from pysource.utils import InAsyncDef as rule
    return rule(logical)


def ReadBytes(path):
    with open(path, 'rb') as f:
        return f.read()


def RunOracle(version, script, stdin_data=None):
    """Runs `script` under Python X.Y; returns its stdout bytes (or None if missing)."""
    interp = Interpreter(version)
    if interp is None:
        return None
    proc = subprocess.Popen([interp, '-c', script], stdin=subprocess.PIPE,
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE)
    out, err = proc.communicate(stdin_data)
    if proc.returncode != 0:
        raise AssertionError('oracle %s failed: %s' % (version, err[-2000:]))
    return out


def Analyzer(version):
    """The shared CPGenAnalyzerImpl of a language version ('2.7' to '3.8'), as the API makes it."""
    from pysource import analysis
    return analysis.GetAnalyzer(version, checks=False).Impl()


def AnalyzeLine(version, source, in_async_def=False):
    """(result, logical) of the first logical line of source analyzed under version."""
    from pysource import utils
    logical = utils.GetLogicalsFromText(source)[0]
    return Analyzer(version).AnalyzeSingleLogical(logical, in_async_def), logical
