"""pytest with the arguments given, or 77 and a reason where there is no pytest."""

import sys

try:
    import pytest
except ImportError:
    print("skipped: python3-pytest is not installed")
    sys.exit(77)

sys.exit(pytest.main(sys.argv[1:]))
