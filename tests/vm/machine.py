"""A machine in QEMU, without hardware's help: started, asked, plugged into, put to sleep and switched off."""
import base64
import ctypes
import json
import os
import select
import signal
import socket
import subprocess
import sys
import time

PATIENCE = 60  # seconds for whatever is waited for; emulated and on a loaded machine, much takes long
START = 240  # seconds for a whole start of the machine
SLOTS = 6  # for controllers that are plugged in: one slot takes one, once
PR_SET_PDEATHSIG = 1


class Failure(Exception):
    """Something did not become as it must be."""


def die_with_parent():
    ctypes.CDLL(None).prctl(PR_SET_PDEATHSIG, signal.SIGKILL)


class Lines:
    """A connection on which lines come and go."""

    def __init__(self, end):
        self.end = end
        self.rest = b""

    def put(self, text):
        self.end.sendall(text.encode() + b"\n")

    def get(self, limit, what):
        deadline = time.monotonic() + limit
        while b"\n" not in self.rest:
            left = deadline - time.monotonic()
            if left <= 0 or not select.select([self.end], [], [], left)[0]:
                raise Failure(f"{what}: no answer within {limit} seconds")
            received = self.end.recv(65536)
            if not received:
                raise Failure(f"{what}: the machine is gone")
            self.rest += received
        line, self.rest = self.rest.split(b"\n", 1)
        return line.decode()


class Machine:
    """One start of a machine, from power on to power off. What outlives it is its disk.

    With a root_port, the disk is a USB disk in that port.
    """

    def __init__(self, base, disk, console, *, root_port=None, sleeps=False, words=""):
        self.console = console
        self.qmp_end, qmp_far = socket.socketpair()
        self.agent_end, agent_far = socket.socketpair()
        self.slots = 0
        far = (qmp_far.fileno(), agent_far.fileno())
        with open(console + ".qemu", "ab") as errors:
            self.process = subprocess.Popen(
                self.command(base, disk, far, root_port, "vmlinuz" if sleeps else "vmlinux", words),
                pass_fds=far, preexec_fn=die_with_parent, stdin=subprocess.DEVNULL, stdout=errors, stderr=errors)
        qmp_far.close()
        agent_far.close()
        self.qmp_lines = Lines(self.qmp_end)
        self.agent = Lines(self.agent_end)
        self.qmp_lines.get(PATIENCE, "QEMU's greeting")
        self.qmp("qmp_capabilities")

    def command(self, base, disk, far, root_port, kernel, words):
        disk_device = f"usb-storage,bus=usb.0,port={root_port},serial=root" if root_port else "virtio-blk-pci"
        slots = [word for number in range(SLOTS)
                 for word in ("-device", f"pcie-root-port,id=slot{number},chassis={number + 1},slot={number + 1}")]
        return ["qemu-system-x86_64", "-nodefaults", "-no-user-config", "-no-reboot",
                "-machine", "q35,sata=off,smbus=off,i8042=off", "-accel", "tcg,tb-size=128", "-m", "384",
                "-display", "none", "-vga", "none", "-serial", f"file:{self.console}",
                "-chardev", f"socket,id=qmp,fd={far[0]}", "-mon", "chardev=qmp,mode=control",
                "-kernel", f"{base}/{kernel}", "-initrd", f"{base}/initrd",
                "-append", f"console=ttyS0 no_timer_check panic=-1 loglevel=5 mitigations=off {words}",
                *slots,
                "-device", "qemu-xhci,id=usb,p2=8,p3=8",
                "-drive", f"file={disk},format=raw,if=none,id=disk,cache=unsafe", "-device", f"{disk_device},drive=disk",
                "-device", "virtio-serial-pci",
                "-chardev", f"socket,id=agent,fd={far[1]}", "-device", "virtserialport,chardev=agent,name=agent"]

    # What QEMU is told.

    def qmp(self, command, **arguments):
        self.qmp_lines.put(json.dumps({"execute": command, "arguments": arguments}))
        while True:
            answer = json.loads(self.qmp_lines.get(PATIENCE, command))
            if "error" in answer:
                raise Failure(f"{command} {arguments}: {answer['error']['desc']}")
            if "return" in answer:
                return answer["return"]

    def wait_event(self, name, limit=PATIENCE):
        """The next event of this name; those before it are of no interest."""
        while json.loads(self.qmp_lines.get(limit, name)).get("event") != name:
            pass

    def plug(self, driver, name, port, bus="usb.0", **properties):
        """Plugs a device into a port. Its serial number is its name, by which it is found inside."""
        self.qmp("device_add", driver=driver, id=name, bus=bus, port=str(port), serial=name, **properties)

    def plug_disk(self, name, port, image, **properties):
        """The same for a disk, which keeps what is written in this image."""
        self.qmp("blockdev-add", driver="raw", file={"driver": "file", "filename": image}, **{"node-name": "node-" + name})
        self.plug("usb-storage", name, port, drive="node-" + name, **properties)

    def plug_controller(self, name):
        self.qmp("device_add", driver="qemu-xhci", id=name, bus=f"slot{self.slots}")
        self.slots += 1

    def pull(self, name):
        self.qmp("device_del", id=name)

    # What is inside.

    def wait_ready(self):
        if self.agent.get(START, "the start") != "ready":
            raise Failure("the agent says something else than that it is ready")

    def ask(self, command, limit=PATIENCE):
        """The status and the output of a command inside."""
        self.agent.put(base64.b64encode(command.encode()).decode())
        status, _, output = self.agent.get(limit, command).partition(" ")
        return int(status), base64.b64decode(output).decode(errors="replace").rstrip("\n")

    def run(self, command, limit=PATIENCE):
        """The output of a command inside that must succeed."""
        status, output = self.ask(command, limit)
        if status:
            raise Failure(f"{command}: status {status}\n{output}")
        return output

    def until(self, what, check, limit=PATIENCE):
        """Asks again until check() says something; returns that."""
        deadline = time.monotonic() + limit
        while True:
            said = check()
            if said:
                return said
            if time.monotonic() >= deadline:
                raise Failure(f"{what}: not within {limit} seconds")
            time.sleep(0.1)

    def until_says(self, command, expected, limit=PATIENCE):
        """Runs a command again until its output is this."""
        said = [""]

        def check():
            said[0] = self.ask(command)[1]
            return said[0] == expected
        try:
            self.until(command, check, limit)
        except Failure as failure:
            raise Failure(f"{failure}: it says\n{said[0]}\nand not\n{expected}") from None

    def equals(self, what, command, expected):
        said = self.run(command)
        if said != expected:
            raise Failure(f"{what}: {command} says\n{said}\nand not\n{expected}")

    def device(self, name):
        """The directory of the device with this name, when it has appeared."""
        find = f"grep -lxF {name} /sys/bus/usb/devices/*/serial"
        return os.path.dirname(self.until(f"{name} appears", lambda: self.ask(find)[1]))

    # Its end.

    def power_off(self):
        self.agent.put(base64.b64encode(b"systemctl poweroff").decode())
        self.wait_end()

    def sleep(self):
        """Returns when the machine sleeps; wakes by wake()."""
        self.run("systemctl suspend >/run/suspend 2>&1 &")
        self.wait_event("SUSPEND")

    def wake(self):
        self.qmp("system_wakeup")

    def wait_end(self):
        try:
            self.process.wait(PATIENCE)
        except subprocess.TimeoutExpired:
            raise Failure(f"the machine does not end within {PATIENCE} seconds") from None

    def kill(self):
        """As if the power were cut."""
        self.process.kill()
        self.process.wait()
        self.qmp_end.close()
        self.agent_end.close()

    def last_words(self):
        """What the console and QEMU said last."""
        said = []
        for path in (self.console, self.console + ".qemu"):
            if os.path.exists(path):
                with open(path, "rb") as file:
                    said += file.read().decode(errors="replace").splitlines()[-40:]
        return "\n".join(said)


class Story:
    """What is told while it goes on: a line for each thing that was seen, with the seconds since the start."""

    def __init__(self, base, work, *words):
        self.began = time.monotonic()
        self.base = base
        self.work = work
        self.words = words
        self.machine = None

    def tell(self, line):
        print(f"{time.monotonic() - self.began:6.1f}  {line}", flush=True)

    def switch_on(self, **how):
        """For the first time or again. What is plugged in now is there before the kernel is."""
        if self.machine:
            self.machine.kill()
        self.machine = Machine(self.base, self.work + "/disk", self.work + "/console", **how)
        return self.machine

    def wait_started(self):
        self.machine.wait_ready()
        self.tell("the machine has started")

    def start(self, **how):
        self.switch_on(**how)
        self.wait_started()
        return self.machine

    def disk_image(self, name):
        """An empty file system to be plugged in."""
        path = f"{self.work}/{name}"
        with open(path, "wb") as file:
            file.truncate(8 << 20)
        subprocess.run(["mke2fs", "-q", "-F", "-t", "ext4", "-O", "^has_journal", path], check=True)
        return path

    def fail(self, failure):
        print(f"FAILED: {failure}", flush=True)
        if not self.machine:
            return
        if self.machine.process.poll() is None:
            self.show_journal()
        print("The console's end:\n" + self.machine.last_words())

    def show_journal(self):
        try:
            print("The journal's end:\n" + self.machine.ask("journalctl --no-pager --no-hostname -n 80")[1])
        except (Failure, OSError) as failure:
            print(failure)


def told(tell):
    """Tells a story as a program: with the base and a directory to work in as its arguments."""
    die_with_parent()
    story = Story(*sys.argv[1:])
    try:
        tell(story)
        story.tell("the end")
    except Failure as failure:
        story.fail(failure)
        sys.exit(1)
    finally:
        if story.machine:
            story.machine.kill()
