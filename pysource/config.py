"""Installation paths of the host."""

import os

# The installation root: the folder that holds resources/ and the packages.
_kRoot = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))


def GetLoomFilename(relative_path):
    """Absolute path of a file under the installation root."""
    return os.path.join(_kRoot, relative_path)
