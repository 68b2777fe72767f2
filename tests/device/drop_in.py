"""tests/device/drop_in.py: the service under a unit that a drop-in changed."""
from calls import wait_for_owner
from camera.machine import Camera
from camera.tour import UNIT

FOLDER = f"/etc/systemd/system/{UNIT}.d"


def install_drop_in(camera: Camera, name: str, text: str) -> None:
    """A drop-in that the running service obeys."""
    camera.put_file(f"{FOLDER}/{name}", text.encode())
    camera.run(f"systemctl daemon-reload && systemctl restart {UNIT}").check()
    wait_for_owner(camera)


def unit_properties(camera: Camera, *names: str) -> dict[str, str]:
    shown = camera.run(["systemctl", "show", UNIT, "-p", ",".join(names)]).check().out
    return dict(line.split("=", 1) for line in shown.splitlines())
