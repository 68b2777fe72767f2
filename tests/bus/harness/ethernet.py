"""tests/bus/harness/ethernet.py: a network interface that reports the link a test wants."""
import ctypes
import fcntl
import os
import socket
import stat
import struct
import tempfile

TUN_DEVICE = os.makedev(10, 200)

# if_tun.h
TUNSETIFF = 0x400454CA
IFF_TAP, IFF_NO_PI = 0x0002, 0x1000

# sockios.h, ethtool.h
SIOCETHTOOL = 0x8946
ETHTOOL_SSET = 2
ETHTOOL_CMD = "=IIIHBBBBBBIIHBBI2I"

HALF, FULL = 0, 1
AUTONEGOTIATION = 0x40


class Ethernet:
    """A tap device in the sandbox's own network, which takes any settings."""

    def __init__(self, name: str = "eth0") -> None:
        self._name = name.encode()
        # The sandbox's /dev has no such device, and is to be left without it.
        with tempfile.TemporaryDirectory(dir="/dev") as folder:
            device = f"{folder}/tun"
            os.mknod(device, 0o600 | stat.S_IFCHR, TUN_DEVICE)
            self._device = os.open(device, os.O_RDWR)
        fcntl.ioctl(self._device, TUNSETIFF,
                    struct.pack("16sH22x", self._name, IFF_TAP | IFF_NO_PI))
        self._socket = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)

    def report(self, speed: int, duplex: int = FULL, advertised: int = 0) -> None:
        """speed is the whole number of 32 bits."""
        settings = struct.pack(ETHTOOL_CMD, ETHTOOL_SSET, 0, advertised, speed & 0xFFFF, duplex,
                               0, 0, 0, 0, 0, 0, 0, speed >> 16, 0, 0, 0, 0, 0)
        buffer = ctypes.create_string_buffer(settings, len(settings))
        fcntl.ioctl(self._socket, SIOCETHTOOL,
                    struct.pack("16sP16x", self._name, ctypes.addressof(buffer)))

    def close(self) -> None:
        self._socket.close()
        os.close(self._device)
