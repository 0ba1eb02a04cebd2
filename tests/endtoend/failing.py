"""A daemon whose system calls on its own files, or whose allocations, fail on demand: failing.c under the real program."""
import errno
import mmap
import pathlib
import struct
import subprocess

SOURCE = pathlib.Path(__file__).with_suffix(".c")
EVER = 2**64 - 1
ERRORS = [errno.ENOSPC, errno.EDQUOT, errno.EIO, errno.EROFS, errno.EMFILE]


class Range:
    """The calls of one kind, counted from 1, that fail: `first` to `last`."""

    def __init__(self, control, at):
        self._control, self._at = control, at

    def _field(number):  # pylint: disable=no-self-argument
        return property(lambda self: struct.unpack_from("=Q", self._control, self._at + 8 * number)[0],
                        lambda self, value: struct.pack_into("=Q", self._control, self._at + 8 * number, value))

    count, first, last, failed = map(_field, range(4))

    def fail(self, first, last):
        self.last = 0  # nothing fails meanwhile
        self.count = self.failed = 0
        self.first, self.last = first, last

    def stop(self):
        self.last = 0


class Failing:
    """Puts itself under the house's next daemon."""

    def __init__(self, house):
        library, control = house.home / "failing.so", house.home / "failing.control"
        subprocess.run(["cc", "-std=gnu17", "-O1", "-Wall", "-Werror", "-shared", "-fPIC", "-o", library, SOURCE], check=True)
        control.write_bytes(bytes(mmap.PAGESIZE))
        self.trace = house.home / "failing.trace"  # all calls, a line each
        self.trace.touch()
        with control.open("r+b") as file:
            self._control = mmap.mmap(file.fileno(), mmap.PAGESIZE)
        self.calls, self.allocations = Range(self._control, 0), Range(self._control, 32)
        house.wrapper = ["env", f"LD_PRELOAD={library}", f"FAILING_CONTROL={control}", f"FAILING_BELOW={house.home}",
                         f"FAILING_TRACE={self.trace}"]

    def fail_calls(self, first, last, error, begin=""):
        """Calls are counted from the first that matches the pattern `begin`, for example "rename */bag.plist"."""
        struct.pack_into("=Q", self._control, 64, error)
        self._control[72:72 + 1024] = bytes(1024)
        self.calls.last = 0
        self._control[72 + 1024:72 + 2048] = begin.encode().ljust(1024, b"\0")
        self.calls.fail(first, last)

    def what(self):
        """The call that failed last, and its file."""
        return self._control[72:72 + 1024].split(b"\0")[0].decode()
