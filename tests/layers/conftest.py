"""tests/layers/conftest.py: where the layers for image builders stand; neither builder is needed."""
import re
from pathlib import Path

TREE = Path(__file__).resolve().parents[2]
YOCTO = TREE / "packaging/yocto/meta-privane"
BUILDROOT = TREE / "packaging/buildroot"

# The first and the last GID of the groups that no method removes, as text.
PERMANENT_GROUPS = tuple(re.findall(r"GROUP_TYPE_PERMANENT_SYSTEM, .*, (\d+), (\d+)\}",
                                    (TREE / "usermgmt/account_types.cpp").read_text())[0])
