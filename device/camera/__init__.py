"""device/camera/__init__.py: the virtual camera; warm_start.py is where scripts and tests begin."""
