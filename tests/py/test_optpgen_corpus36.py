"""pysource.optpgen against lib2to3's parser and CPython on the 3.6 stdlib."""

import unittest

from tests.py.test_optpgen_corpus import DifferentialMixin


class Corpus36Test(DifferentialMixin, unittest.TestCase):
    kVersion = '3.6'
    kPy3Grammar = True


if __name__ == '__main__':
    unittest.main()
