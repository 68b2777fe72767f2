"""device/camera/system_tour.py: the part of the tour that is not about accounts: units, clocks, the
network, the disk, the boot block, small readers, and at last a reboot."""
from .bus_call import PRIVANE_ERROR, call
from .transcript import Transcript, sync_journal

HOUR = 3600
SIGNAL_RECORD = "/run/account-watcher/signals"
# What the kernel has still to make up for: adjtimex(2), ADJ_OFFSET_SS_READ.
LEFT_TO_SLEW = """perl -e '$t = pack("L x4 q x192", 0xa001, 0); syscall(159, $t) < 0 and die $!;
         print unpack("x8 q", $t), "\\n"'"""


def walk_through_system(show: Transcript) -> None:
    _show_units(show)
    _show_clocks(show)
    _show_network(show)
    _show_disk_and_boot_block(show)
    _show_readers(show)
    _show_own_programs(show)
    _show_reboot(show)


def _await(show: Transcript, condition: str) -> None:
    """systemd answers when a job is queued; what follows waits, out of sight, until it is done."""
    show.camera.run(f"for try in {{1..100}}; do {condition} && exit; sleep 0.1; done; exit 1").check()


def _expect_state(show: Transcript, unit: str, state: str, says: str) -> None:
    command = ["systemctl", "show", "--value", "-p", "ActiveState", unit]
    _await(show, f"[ $({' '.join(command)}) = {state} ]")
    show.step(command, shows=[f"{state}\n"], says=says)


def _main_pid(show: Transcript, unit: str) -> str:
    return show.camera.run(["systemctl", "show", "--value", "-p", "MainPID", unit]).check().out


def _restart(show: Transcript, command: str, unit: str) -> None:
    before = _main_pid(show, unit)
    show.step(command, shows=["()\n"], says="It is restarted:")
    _await(show, f"[ $(systemctl show --value -p MainPID {unit}) -gt 0 ] && "
                 f"[ $(systemctl show --value -p MainPID {unit}) != {before.strip()} ]")
    after = show.step(["systemctl", "show", "--value", "-p", "MainPID", unit],
                      says=f"another process than {before.strip()}.")
    show.expect(after.out != before, after, "another process")


def _show_units(show: Transcript) -> None:
    show.chapter("Units")
    show.step(call("StartNtp"), shows=["()\n"], says="Two units have methods of their own: ntp,")
    _expect_state(show, "ntp", "active", "which runs now.")
    _restart(show, call("RestartNtp"), "ntp")
    show.step(call("StopNtp"), shows=["()\n"], says="And it is stopped.")
    _expect_state(show, "ntp", "inactive", "So it is.")
    show.step(call("StartLensd"), shows=["()\n"], says="The other one is lensd,")
    _expect_state(show, "lensd", "active", "which runs")
    show.step(call("StopLensd"), shows=["()\n"], says="until it is stopped.")
    _expect_state(show, "lensd", "inactive", "So it is.")
    show.step(call("StartService", "lensd"), shows=["()\n"],
              says="Any unit is started by its bare name; the action of polkit names it.")
    _expect_state(show, "lensd", "active", "It runs.")
    show.step(call("ReloadService", "lensd"), shows=["()\n"], says="It reads its settings again,")
    _await(show, "[ -s /run/lensd/reloads ]")
    show.step(["cat", "/run/lensd/reloads"], shows=["reloaded\n"], says="as it says itself.")
    _restart(show, call("RestartService", "lensd"), "lensd")
    show.step(call("StopService", "lensd"), shows=["()\n"], says="And it is stopped.")
    _expect_state(show, "lensd", "inactive", "So it is.")
    show.step(call("StartService", "../lensd"), status=1,
              shows=[f"{PRIVANE_ERROR}29: Invalid unit '../lensd': Name contained invalid"],
              says="What is no bare name never reaches systemd.")
    show.step(call("SetDefaultTarget", "multi-user"), shows=["()\n"],
              says="What the camera boots into,")
    show.step(["systemctl", "get-default"], shows=["multi-user.target\n"], says="by systemd's word.")


def _show_clocks(show: Transcript) -> None:
    show.chapter("Clocks")
    now = int(show.camera.run(["date", "+%s"]).check().out)
    show.step(call("SetTimeOfDay", str(now + HOUR), "0"), shows=["(0,)\n"],
              says="An hour ahead: 0 is the kernel's answer.")
    for command in (["date", "+%s"], ["sh", "-c", "date -d \"$(hwclock -r)\" +%s"]):
        clock = show.step(command, says="The system's clock followed," if command[0] == "date"
                          else "and the hardware clock with it.")
        show.expect(abs(int(clock.out) - now - HOUR) < 60, clock, "the new time")
    show.step(call("AdjTime", "1", "500000"), shows=["()\n"],
              says="One and a half seconds more, slowly, so that no time is skipped:")
    left = show.step(LEFT_TO_SLEW, says="so many microseconds are still to come.")
    show.expect(0 < int(left.out) <= 1_500_000, left, "an adjustment on its way")
    show.step(call("NotifyTimeSync"), shows=["()\n"], says="The rest of the camera is told,")
    sync_journal(show.camera)
    show.step(["journalctl", "-t", "ntpd_hook", "-o", "cat"], shows=["settime\n"],
              says="by a hook that the maker of the camera fills.")


def _show_network(show: Transcript) -> None:
    show.chapter("The network")
    show.step(call("GetNetworkSpeedDuplex"), shows=["(uint32 1000, false, uint32 64)\n"],
              says="1000 Mbit/s, not half duplex, autonegotiation on:")
    show.step("ethtool eth0 | grep -E 'Speed|Duplex|Auto'",
              shows=["Speed: 1000Mb/s", "Duplex: Full", "Auto-negotiation: on"],
              says="the same by ethtool.")
    show.step(f"{call('ExecuteEthtool', 'd', 'eth0')} | cut -c -200", shows=["MAC Registers"],
              says="The registers of the card, where only root may look.")
    show.step(f"{call('GetActiveNetworkInfo', 'all')} | cut -c -500",
              shows=["Active Internet connections", "apache2"],
              says="Connections and the programs behind them.")
    show.step(call("StartService", "lldp-neighbour"), shows=["()\n"],
              says="Another device is plugged in,")
    show.step(call("StartService", "lldpd"), shows=["()\n"], says="and lldpd looks around.")
    show.step(f"for try in {{1..60}}; do {call('ExecuteLldpcli', 'show-neighbors')} >/run/seen;\n"
              "    grep -q port7 /run/seen && break; sleep 0.5; done; cut -c -1500 /run/seen",
              shows=["LLDP neighbors", "port7"], says="It found its neighbour.")


def _show_disk_and_boot_block(show: Transcript) -> None:
    show.chapter("The disk and the boot block")
    show.step(f"{call('ExecuteSmartctl', 'all', '/dev/sda')} | cut -c -400",
              shows=["smartctl 7", "QEMU HARDDISK"], says="How healthy the disk is.")
    serial = show.step(["fw_printenv", "-n", "SERNO"], says="By the boot loader's own tool,")
    show.step(call("ReadSerno"), shows=[f"('{serial.out.strip()}',)\n"],
              says="and by the service: the same serial number.")
    show.step(call("AddBootblockParam", "COLOUR", "black"), shows=["()\n"],
              says="A new parameter, in the older of the two copies,")
    show.step(call("ReadBootblockParam", "COLOUR"), shows=["('black',)\n"], says="read back,")
    show.step(["fw_printenv", "COLOUR"], shows=["COLOUR=black\n"], says="and by the tool.")


def _show_readers(show: Transcript) -> None:
    show.chapter("Small readers")
    show.step(f"{call('GetSlabinfo')} | cut -c -200", shows=["slabinfo - version: 2.1"],
              says="The kernel's own use of memory.")
    show.step(call("ReadLogFile", "/etc/hostname"), shows=["('camera\\n',)\n"],
              says="A file; the action is worth as much as root.")


def _show_own_programs(show: Transcript) -> None:
    show.chapter("Programs of the device")
    answer = show.step(call("Pinsrv", "['pinsrv', '--port', '4711']"),
                       says="The PIN server is started, and this is its process.")
    pid = answer.out.strip("(,)\n")
    show.step(f"tr '\\0' ' ' </proc/{pid}/cmdline", shows=["/usr/bin/pinsrv --port 4711 "],
              says="It has the arguments behind the first.")
    heard = len(show.camera.read_file(SIGNAL_RECORD).splitlines())
    show.step(call("RtspreadConfig"), shows=["()\n"],
              says="Every client is told to look at the accounts again,")
    _await(show, f"[ $(wc -l <{SIGNAL_RECORD}) -gt {heard} ]")
    show.step(["tail", "-n", "1", SIGNAL_RECORD], shows=["UserDatabaseUpdated ()"],
              says="as this one heard.")
    show.step(call("Digest", "['create', 'guest:PRIVANE:00112233445566778899aabbccddeeff']"),
              shows=["()\n"], says="A user of the web alone, without an account.")
    show.step(call("GetDigestList"), shows=["(['guest'],)\n"], says="Who may log in over the web.")


def _show_reboot(show: Transcript) -> None:
    show.chapter("Reboot")
    boot = show.camera.run(["cat", "/proc/sys/kernel/random/boot_id"]).check().out
    show.step(call("UpdateReleaseFile", "SOFT_RESET"), shows=["()\n"],
              says="The next reboot resets the camera to its factory settings.")
    show.step(call("Reboot"), shows=["(0,)\n"], says="And there it goes.")
    show.camera.wait_for_reboot()
    again = show.step(["cat", "/proc/sys/kernel/random/boot_id"], says="Up again: another boot.")
    show.expect(again.out != boot, again, "another boot")
    show.step(["cat", "/var/lib/sysflash/resets"], shows=["soft\n"],
              says="The firmware manager was asked for the soft reset.")
    show.step(call("ReadBootblockParam", "COLOUR"), shows=["('black',)\n"],
              says="The boot block kept what was written.")
