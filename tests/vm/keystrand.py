"""keystrand and kstd as they are installed on a machine: who sits there, what is plugged in, and what became of it."""
import json

from machine import Failure

D = "/sys/bus/usb/devices"
PARAMETER = "/sys/module/usbcore/parameters/authorized_default"
OPEN, CLOSED = "1", "2"  # ports inside the machine stay open
LOGIN1 = "org.freedesktop.login1"


class Keystrand:
    def __init__(self, vm, story):
        self.vm = vm
        self.story = story

    def wait_running(self):
        for unit in ("keystrand.service", "keystrand-sessions.service"):
            self.vm.until_says(f"systemctl is-active {unit}", "active")

    def set_period(self, seconds):
        """For a service that is to start again."""
        self.vm.run(f"mkdir -p /etc/keystrand; echo 'period = {seconds}' >/etc/keystrand/keystrand.conf; sync")
        self.vm.run("systemctl restart keystrand.service")
        self.wait_running()

    def main_process(self):
        return self.vm.run("systemctl show --property=MainPID --value keystrand.service")

    # Who sits there.

    def log_in(self):
        self.vm.run("systemctl start person.service")
        self.vm.until("a session", self.session)
        self.await_unlocked()

    def log_out(self):
        self.vm.run("systemctl stop person.service")

    def session(self):
        listed = json.loads(self.vm.run("loginctl --output=json list-sessions") or "[]")
        return next((each["session"] for each in listed if each["user"] == "person"), None)

    def hint(self, locked):
        answer = self.vm.run(f"busctl call {LOGIN1} /org/freedesktop/login1 {LOGIN1}.Manager "
                             f"GetSession s {self.session()}")
        path = answer.split('"')[1]
        self.vm.run(f"busctl call {LOGIN1} {path} {LOGIN1}.Session SetLockedHint b {'true' if locked else 'false'}")

    def lock(self):
        self.hint(True)
        self.vm.until("keystrand knows that it is locked", self.is_locked)

    def unlock(self):
        self.hint(False)
        self.await_unlocked()

    def is_locked(self):
        """As the service that runs knows it; one that has just started has heard of nobody."""
        is_locked = True
        for line in self.lines():
            if line.startswith(("keystrand: ready", "keystrand: the machine is locked")):
                is_locked = True
            elif line.startswith("keystrand: the machine is unlocked"):
                is_locked = False
        return is_locked

    def await_unlocked(self):
        self.vm.until("keystrand knows that it is unlocked", lambda: not self.is_locked())
        self.await_open()

    # What the service says and does.

    def lines(self):
        return self.vm.run("journalctl -b -u keystrand.service -o cat --no-pager").splitlines()

    def count(self, beginning):
        return sum(line.startswith(beginning) for line in self.lines())

    def await_line(self, beginning, seen=0):
        """Waits for one line more than were seen, and returns it."""
        def newest():
            found = [line for line in self.lines() if line.startswith(beginning)]
            return found[seen:] and found[-1]
        return self.vm.until(f"a line that begins with {beginning!r}", newest)

    def kstctl(self, words):
        """What kstctl shows for these words."""
        return json.loads(self.vm.run(f"kstctl --json {words}"))

    def status(self):
        """Status 5 is that something is not known: the daemon may just be making its database."""
        return json.loads(self.vm.run("kstctl --json status 2>/dev/null || [ $? -eq 5 ]"))

    def gate(self):
        return self.status()["gate"]

    def listed(self, name):
        """What kstctl says of the device with this name."""
        return next(each for each in self.kstctl("devices")["devices"] if each["serial"] == name)

    def await_saved(self, check):
        """Waits until what kstd has on disk for the next start is so."""
        self.vm.until("kstd has saved the state", lambda: check(self.status()["stateFile"]))

    def await_gate(self, **expected):
        """Waits until kstctl shows these of the gate, and returns all."""
        def shown():
            gate = self.gate()
            return all(gate[key] == value for key, value in expected.items()) and gate
        return self.vm.until(f"the gate becomes {expected}", shown)

    def root_hubs(self):
        return set(self.vm.run(f"cat {D}/usb*/authorized_default").split())

    def await_open(self):
        self.vm.until("each root hub is open", lambda: self.root_hubs() == {OPEN})

    def await_closed(self):
        self.vm.until("each root hub is closed", lambda: self.root_hubs() == {CLOSED})
        self.vm.equals("so is the parameter", f"cat {PARAMETER}", CLOSED)

    # What is plugged in.

    def is_in(self, name, driver=None):
        """Waits until the device is in, and bound to its driver when one is named."""
        directory = self.vm.device(name)
        self.vm.until_says(f"cat {directory}/authorized", "1")
        if driver:
            self.vm.until_says(f"basename $(readlink {directory}:1.0/driver)", driver)
        return directory

    def is_refused(self, name):
        """Waits for the line, looks at the device, and returns its port."""
        directory = self.vm.device(name)
        port = directory.rsplit("/", 1)[1]
        line = self.await_line(f"keystrand: refused {port} (")
        if f'serial "{name}"' not in line:
            raise Failure(f"the line on {name} does not name it: {line}")
        self.vm.equals(f"{name} is refused", f"cat {directory}/authorized", "0")
        return port

    def disk_of(self, name):
        """The disk that a device became."""
        find = f"basename $(ls -d {self.vm.device(name)}:1.0/host*/target*/*/block/sd*)"

        def found():
            status, disk = self.vm.ask(find)
            return status == 0 and disk.startswith("sd") and disk
        return "/dev/" + self.vm.until(f"{name} is a disk", found)

    def survives(self, disk):
        """What is written to an attached disk is read back from it, not from memory."""
        self.vm.run("echo written >/mnt/file; sync; echo 3 >/proc/sys/vm/drop_caches; grep -qx written /mnt/file && "
                    f"grep -q '^{disk} /mnt ' /proc/mounts")
