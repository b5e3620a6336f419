"""Campaigns: the long searches of this tree, on whatever machines there are. See scripts/campaign --help."""
