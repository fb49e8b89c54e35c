# Python 2 code: treelens picks the 2.7 grammar for this file by itself.
import sys
import urllib2


def fetch(url, retries=3):
    for attempt in xrange(retries):
        try:
            return urllib2.urlopen(url).read()
        except urllib2.URLError, e:
            print >>sys.stderr, "retry", attempt, e
    raise IOError, "gave up on %s" % url
