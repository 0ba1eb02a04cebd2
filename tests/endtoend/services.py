"""The system's services that the daemon asks, on a message bus of the case's own in the system bus's place."""
import collections
import socket
import subprocess
import threading

from jeepney import DBusAddress, HeaderFields, MessageType, message_bus, new_error, new_method_call, new_method_return, new_signal
from jeepney.io.blocking import open_dbus_connection

from house import start_bus

NETWORK = "org.freedesktop.NetworkManager"
GEOCLUE = "org.freedesktop.GeoClue2"
PLACE = GEOCLUE + ".Location"
LOGIND = "org.freedesktop.login1"
CLIENT = DBusAddress("/client", interface=GEOCLUE + ".Client")


class SystemBus:
    """A bus. `calls` counts the calls of everybody on it, by member."""

    def __init__(self, directory):
        self.process, self.address = start_bus(directory, stderr=subprocess.DEVNULL)
        self.calls = collections.Counter()
        monitor = open_dbus_connection(self.address)
        monitor.send_and_get_reply(new_method_call(
            DBusAddress("/org/freedesktop/DBus", "org.freedesktop.DBus", "org.freedesktop.DBus.Monitoring"),
            "BecomeMonitor", "asu", ([], 0)))
        follow(monitor, self._count)

    def _count(self, message):
        if message.header.message_type == MessageType.method_call:
            self.calls[message.header.fields[HeaderFields.member]] += 1

    def stop(self):
        self.process.terminate()
        self.process.wait()


def system_bus(house):
    """A bus for the house's daemon, which ends with the house."""
    bus = SystemBus(house.directory("system-bus"))
    house.others.append(bus.process)
    house.environment["DBUS_SYSTEM_BUS_ADDRESS"] = bus.address
    house.passed_on += "|DBUS_SYSTEM"
    return bus


def follow(connection, handle):
    """Gives every message to `handle`, on a thread, until the bus has gone."""
    def receive():
        try:
            while True:
                handle(connection.receive())
        except (OSError, EOFError):
            pass
    threading.Thread(target=receive, daemon=True).start()


class Services:
    """NetworkManager, GeoClue with one client, and logind. They are what their properties say, which `change` sets."""

    def __init__(self, bus):
        self._lock = threading.Lock()
        self._properties = {
            NETWORK: {"Version": ("s", "1.42.4"), "State": ("u", 70), "Metered": ("u", 4)},
            PLACE: {"Latitude": ("d", 47.3769), "Longitude": ("d", 8.5417), "Accuracy": ("d", 20.0)},
            LOGIND + ".Session": {"Active": ("b", True), "IdleHint": ("b", False), "LockedHint": ("b", False)},
        }
        self._connection = open_dbus_connection(bus.address)
        for name in (NETWORK, GEOCLUE, LOGIND):
            self._connection.send_and_get_reply(message_bus.RequestName(name))
        follow(self._connection, self._serve)

    def change(self, interface, **values):
        with self._lock:
            properties = self._properties[interface]
            for name, value in values.items():
                properties[name] = (properties[name][0], value)
        if interface == NETWORK:
            changes = DBusAddress("/org/freedesktop/NetworkManager", interface="org.freedesktop.DBus.Properties")
            self._send(new_signal(changes, "PropertiesChanged", "sa{sv}as", (interface, properties, [])))
        elif interface == PLACE:
            self._send(new_signal(CLIENT, "LocationUpdated", "oo", ("/", "/place")))

    def stop(self):
        self._connection.sock.shutdown(socket.SHUT_RDWR)

    def _send(self, message):
        with self._lock:
            self._connection.send(message)

    def _serve(self, message):
        if message.header.message_type != MessageType.method_call:
            return
        member = message.header.fields[HeaderFields.member]
        if member == "GetAll":
            with self._lock:
                properties = dict(self._properties[message.body[0]])
            self._send(new_method_return(message, "a{sv}", (properties,)))
        elif member == "GetClient":
            self._send(new_method_return(message, "o", ("/client",)))
        elif member in ("Start", "Stop", "Set"):
            self._send(new_method_return(message))
            if member == "Start":
                self._send(new_signal(CLIENT, "LocationUpdated", "oo", ("/", "/place")))
        else:
            self._send(new_error(message, "org.freedesktop.DBus.Error.UnknownMethod"))
