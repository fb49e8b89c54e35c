"""CNodeToTextConverter over every expression node of the 3.6 standard library (see the 2.7 module)."""

import unittest

from tests.py import test_nodes_totext_corpus as base


def setUpModule():
    base.setUpModule()


class CorpusTest36(base.CorpusCheck, unittest.TestCase):

    def testStdlib36(self):
        self.Check('3.6')


if __name__ == '__main__':
    unittest.main()
