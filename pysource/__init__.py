"""pysource: the host package of the treelens analysis engine.

The native modules (_fastaccess, optpgen, treelens) are built into
``<build>/pysource``; that folder is put first on this package's path. The
build folder is $TREELENS_BUILD_DIR when set, else ``build`` beside this
package's parent folder.
"""

import os as _os

_root = _os.path.dirname(_os.path.dirname(_os.path.abspath(__file__)))
_build = _os.environ.get('TREELENS_BUILD_DIR') or _os.path.join(_root, 'build')
_native = _os.path.join(_os.path.abspath(_build), 'pysource')
if _os.path.isdir(_native) and _native not in __path__:
    __path__.insert(0, _native)
del _os, _root, _build, _native
