"""device/camera/paths.py: where things stand in the tree."""
from pathlib import Path

DEVICE = Path(__file__).resolve().parent.parent
TREE = DEVICE.parent
