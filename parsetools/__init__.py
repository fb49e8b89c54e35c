"""Host helpers for parsing: the logical-line record type (logicalline)."""
