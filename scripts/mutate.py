#!/usr/bin/env python3
"""Mutation testing of the plug-in library (the command; its parts are in scripts/mutation/,
and `scripts/mutate.py --help` says what it does)."""

import sys
from pathlib import Path

sys.dont_write_bytecode = True  # leaves no __pycache__ in the source tree
sys.path.insert(0, str(Path(__file__).resolve().parent))

from mutation.cli import main  # noqa: E402

if __name__ == "__main__":
    sys.exit(main())
