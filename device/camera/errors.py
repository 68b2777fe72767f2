"""device/camera/errors.py: the one failure that everything about the camera is reported with."""


class CameraError(Exception):
    """The text is for a person who knows nothing of the inside."""
