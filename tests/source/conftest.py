"""tests/source/conftest.py: what the tests of the source ring share; they need no build."""
import sys
from pathlib import Path

TREE = Path(__file__).resolve().parents[2]
sys.path.insert(0, str(TREE / "tools"))
