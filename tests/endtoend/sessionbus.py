"""A private session bus, which starts the search provider from its own files, as a desktop's does."""
import configparser
import pathlib
import subprocess

from house import CLIENTS, TIMEOUT, start_bus

PROVIDER = CLIENTS / "search-provider"


def entries(file):
    """The entries of an installed file. Section names are left out: each file has one."""
    parser = configparser.ConfigParser(interpolation=None)
    parser.optionxform = str
    parser.read_string((PROVIDER / file).read_text())
    return dict(parser[parser.sections()[0]])


class SessionBus:
    def __init__(self, house, *options):
        """`options` are the provider's."""
        provider = entries("com.quorvane.tavrin.SearchProvider.ini")
        self.name, self.path = provider["BusName"], provider["ObjectPath"]
        directory = house.directory("bus")
        service = (PROVIDER / f"{self.name}.service.in").read_text()
        command = " ".join([str(PROVIDER / "tavrin-search-provider"), *options])
        pathlib.Path(directory, f"{self.name}.service").write_text(service.replace("@TAVRIN_SEARCH_PROVIDER@", command))
        self.environment = {**house.environment, "PYTHONPATH": str(PROVIDER.parent / "python")}
        self._process, self.address = start_bus(directory, env=self.environment, stderr=subprocess.PIPE)
        house.others.append(self._process)
        self._reader = house.log.pump(self._process.stderr)  # ends after the bus and the provider have
        self.environment["DBUS_SESSION_BUS_ADDRESS"] = self.address

    def gdbus(self, member, *arguments):
        """What `gdbus call` prints."""
        done = subprocess.run(["gdbus", "call", "--session", "--dest", self.name, "--object-path", self.path, "--method", member,
                               *arguments], env=self.environment, capture_output=True, text=True, timeout=TIMEOUT, check=False)
        return done.stdout + done.stderr

    def end(self):
        """Ends the bus, and with it the provider."""
        self._process.terminate()
        self._process.wait()
        self._reader.join()
