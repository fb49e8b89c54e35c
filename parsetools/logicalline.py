"""The host's logical-line record type.

LogicalLineType is the native CLogicalLine type of pysource._fastaccess; the
analyzer checks records against it by exact type.
"""

from pysource._fastaccess import LogicalLineType

CLogicalLine = LogicalLineType
