"""tests/bus/test_interface.py: the object that the service shows on the bus."""
import pytest
from gi.repository import Gio

from harness.bus import INTERFACE, NAME, PATH, UNKNOWN_METHOD, Bus, BusError, error_of
from harness.interface import METHODS, SIGNAL
from harness.service import Service

STANDARD_INTERFACES = {"org.freedesktop.DBus.Properties", "org.freedesktop.DBus.Introspectable",
                       "org.freedesktop.DBus.Peer"}


def introspect(bus: Bus, path: str) -> Gio.DBusNodeInfo:
    (xml,) = bus.send(NAME, path, "org.freedesktop.DBus.Introspectable", "Introspect")
    return Gio.DBusNodeInfo.new_for_xml(xml)


def interface_of(bus: Bus) -> Gio.DBusInterfaceInfo:
    return introspect(bus, PATH).lookup_interface(INTERFACE)


def signatures(arguments: list[Gio.DBusArgInfo]) -> tuple[str, ...]:
    return tuple(argument.signature for argument in arguments)


def test_there_are_46_methods() -> None:
    assert len(METHODS) == 46
    assert len({method.member for method in METHODS}) == 46


def test_members_have_their_signatures_in_order(service: Service, bus: Bus) -> None:
    shown = [(method.name, signatures(method.in_args), signatures(method.out_args))
             for method in interface_of(bus).methods]

    assert shown == [(method.member, method.inputs, method.outputs) for method in METHODS]


def test_one_signal_and_no_properties(service: Service, bus: Bus) -> None:
    interface = interface_of(bus)

    assert [(signal.name, signatures(signal.args))
            for signal in interface.signals] == [(SIGNAL, ())]
    assert not interface.properties


def test_object_shows_one_interface_of_its_own(service: Service, bus: Bus) -> None:
    names = {interface.name for interface in introspect(bus, PATH).interfaces}

    assert names == STANDARD_INTERFACES | {INTERFACE}


@pytest.mark.parametrize("path", ["/", "/com", "/com/zintor"])
def test_folders_above_the_object_only_lead_to_it(path: str, service: Service, bus: Bus) -> None:
    node = introspect(bus, path)

    assert INTERFACE not in {interface.name for interface in node.interfaces}
    assert len(node.nodes) == 1
    assert (PATH + "/").startswith(f"{path.rstrip('/')}/{node.nodes[0].path}/")


@pytest.mark.parametrize("path", ["/", "/com", "/com/zintor", PATH + "/more", "/com/zintor/Other"])
def test_methods_are_served_at_one_path(path: str, service: Service, bus: Bus) -> None:
    error = error_of(bus.send, NAME, path, INTERFACE, "GetUserList")

    assert error.name == UNKNOWN_METHOD


def test_unknown_member_is_told(service: Service, bus: Bus) -> None:
    assert error_of(bus.call, "GetEverything") == BusError(
        UNKNOWN_METHOD, "No such method “GetEverything”")


def test_wrong_arguments_are_told(service: Service, bus: Bus) -> None:
    error = error_of(bus.call, "CheckUser", "u", 1)

    assert error.name == "org.freedesktop.DBus.Error.InvalidArgs"
