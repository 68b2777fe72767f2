"""device/camera/__main__.py: what ./run does once all is built: the camera, the tour, the shell."""
import argparse
import signal
import sys
import time
from pathlib import Path
from types import FrameType

from .errors import CameraError
from .layer_cache import LayerCache
from .machine import Camera
from .paths import TREE
from .tour import Tour
from .warm_start import start_camera


def write(text: str) -> None:
    sys.stdout.write(text)
    sys.stdout.flush()


def say(text: str) -> None:
    write(f"run: {text}\n")


def arguments() -> argparse.Namespace:
    parser = argparse.ArgumentParser(prog="./run")
    parser.add_argument("--build", type=Path, default=TREE / "build")
    parser.add_argument("--kvm", action="store_true")
    parser.add_argument("--fresh", action="store_true")
    parser.add_argument("--shell", action=argparse.BooleanOptionalAction,
                        default=sys.stdin.isatty())
    return parser.parse_args()


def end_in_order(number: int, frame: FrameType | None) -> None:
    """A signal becomes an exception, so that the camera is ended on the way out."""
    raise SystemExit(128 + number)


def tour_and_shell(camera: Camera, shell: bool) -> None:
    # The snapshot is as old as the image; the camera is told today's time.
    camera.run(["date", "--utc", "--set", f"@{int(time.time())}"]).check()
    Tour(camera, write, bold=sys.stdout.isatty()).walk()
    write("\n")
    if shell:
        say("this is a root shell inside the camera; leave it with exit or Ctrl-]")
        still_on = camera.shell.interact()
        write("\n")
        if not still_on:
            return
    say("powering the camera off")
    camera.power_off()


def main() -> int:
    options = arguments()
    if options.shell and not sys.stdin.isatty():
        print("run: --shell needs a terminal", file=sys.stderr)
        return 2
    for number in (signal.SIGTERM, signal.SIGHUP):
        signal.signal(number, end_in_order)
    try:
        cache = LayerCache(options.build / "camera", say)
        with start_camera(cache, options.build / "packages", kvm=options.kvm,
                          fresh=options.fresh) as camera:
            tour_and_shell(camera, options.shell)
    except CameraError as error:
        print(f"run: {error}", file=sys.stderr)
        if options.kvm:
            print("run: without --kvm the camera needs nothing of this machine", file=sys.stderr)
        return 1
    except KeyboardInterrupt:
        print("\nrun: interrupted", file=sys.stderr)
        return 130
    return 0


if __name__ == "__main__":
    sys.exit(main())
