# A small module to show what treelens finds on each logical line.
import os.path as osp
from collections import OrderedDict, namedtuple as nt


class Point(object):
    """A point in the plane."""

    def __init__(self, x, y=0):  # type: (int, int) -> None
        self.x, self.y = x, \
            y

    @property
    def norm(self):
        return (self.x ** 2 + self.y ** 2) ** 0.5


def load(path, *args, **kwargs):
    table = OrderedDict()
    with open(osp.join(path, 'data')) as f:
        for i, line in enumerate(f):
            table[i] = [w for w in line.split() if w]
    try:
        count = len(table)
    except TypeError as e:
        count = -1
    else:
        pass
    return lambda k=count: table.get(k)
