"""tests/layers/conftest.py: where the layers for image builders stand; neither builder is needed."""
from pathlib import Path

TREE = Path(__file__).resolve().parents[2]
YOCTO = TREE / "packaging/yocto/meta-privane"
BUILDROOT = TREE / "packaging/buildroot"
