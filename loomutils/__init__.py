"""Host utilities shared by the analysis modules (reflect: error reporting)."""
