"""A machine in QEMU, without hardware's help: started, asked, plugged into, put to sleep and switched off."""
import ctypes
import datetime
import json
import os
import select
import signal
import socket
import subprocess
import sys
import time

PATIENCE = 60  # seconds of the machine's own time for whatever is waited for
FAR = 900  # seconds of ours for one answer: only what hangs takes that long
SLOTS = 6  # for controllers that are plugged in: one slot takes one, once
PR_SET_PDEATHSIG = 1


class Failure(Exception):
    """Something did not become as it must be."""


def die_with_parent():
    ctypes.CDLL(None).prctl(PR_SET_PDEATHSIG, signal.SIGKILL)


class Lines:
    """A connection on which lines come and go, some with more behind them."""

    def __init__(self, end):
        self.end = end
        self.rest = b""

    def put(self, text):
        self.end.sendall(text.encode() + b"\n")

    def get(self, what):
        while b"\n" not in self.rest:
            self.receive(what)
        line, self.rest = self.rest.split(b"\n", 1)
        return line.decode()

    def get_bytes(self, size, what):
        while len(self.rest) < size:
            self.receive(what)
        taken, self.rest = self.rest[:size], self.rest[size:]
        return taken

    def receive(self, what):
        if not select.select([self.end], [], [], FAR)[0]:
            raise Failure(f"{what}: no answer within {FAR} seconds")
        try:
            received = self.end.recv(65536)
        except ConnectionError:
            received = b""
        if not received:
            raise Failure(f"{what}: the machine is gone")
        self.rest += received


class Machine:
    """One start of a machine, from power on to power off. What outlives it is its disk.

    With a root_port, the disk is a USB disk in that port. When it starts its clock says our time, and some hours
    more. From then on it counts the instructions that are executed, and goes on while there are none, so no time
    inside depends on how busy we are. While the machine sleeps such a clock stands still: one that is to wake by an
    alarm has our time, and more patience with it.
    """

    def __init__(self, base, disk, console, *, root_port=None, sleeps=False, wakes=False, words="", hours_later=0):
        self.wakes = wakes
        self.patience = FAR if wakes else PATIENCE
        self.console = console
        self.date = datetime.datetime.utcnow() + datetime.timedelta(hours=hours_later)
        self.uptime = 0.0
        self.events = []
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
        self.qmp_lines.get("QEMU's greeting")
        self.qmp("qmp_capabilities")

    def command(self, base, disk, far, root_port, kernel, words):
        device = f"usb-storage,bus=usb.0,port={root_port},serial=root" if root_port else "virtio-blk-pci"
        slots = [word for number in range(SLOTS)
                 for word in ("-device", f"pcie-root-port,id=slot{number},chassis={number + 1},slot={number + 1}")]
        return ["qemu-system-x86_64", "-nodefaults", "-no-user-config", "-no-reboot", "-S",
                "-machine", "q35,sata=off,smbus=off,i8042=off", "-accel", "tcg,tb-size=128", "-m", "384",
                *([] if self.wakes else ["-icount", "shift=1"]),
                "-rtc", f"base={self.date.isoformat(timespec='seconds')},clock=host",
                "-display", "none", "-vga", "none", "-serial", f"file:{self.console}",
                "-chardev", f"socket,id=qmp,fd={far[0]}", "-mon", "chardev=qmp,mode=control",
                "-kernel", f"{base}/{kernel}", "-initrd", f"{base}/initrd",
                "-append", f"console=ttyS0 no_timer_check panic=-1 loglevel=5 mitigations=off {words}",
                *slots,
                "-device", "qemu-xhci,id=usb,p2=8,p3=8",
                "-drive", f"file={disk},format=raw,if=none,id=disk,cache=unsafe", "-device", f"{device},drive=disk",
                "-device", "virtio-serial-pci",
                "-chardev", f"socket,id=agent,fd={far[1]}", "-device", "virtserialport,chardev=agent,name=agent"]

    # What QEMU is told.

    def qmp(self, command, **arguments):
        self.qmp_lines.put(json.dumps({"execute": command, "arguments": arguments}))
        while True:
            answer = json.loads(self.qmp_lines.get(command))
            if "error" in answer:
                raise Failure(f"{command} {arguments}: {answer['error']['desc']}")
            if "return" in answer:
                return answer["return"]
            self.events.append(answer["event"])

    def wait_event(self, name):
        """The next event of this name; those before it are of no interest."""
        while name not in self.events:
            self.events.append(json.loads(self.qmp_lines.get(name))["event"])
        del self.events[:self.events.index(name) + 1]

    def plug(self, driver, name, port, bus="usb.0", **properties):
        """Plugs a device into a port. Its serial number is its name, by which it is found inside."""
        self.qmp("device_add", driver=driver, id=name, bus=bus, port=str(port), serial=name, **properties)

    def plug_disk(self, name, port, image, **properties):
        """The same for a disk, which keeps what is written in this image."""
        self.qmp("blockdev-add", driver="raw", file={"driver": "file", "filename": image},
                 **{"node-name": "node-" + name})
        self.plug("usb-storage", name, port, drive="node-" + name, **properties)

    def plug_controller(self, name):
        self.qmp("device_add", driver="qemu-xhci", id=name, bus=f"slot{self.slots}")
        self.slots += 1

    def pull(self, name):
        self.qmp("device_del", id=name)

    # What is inside.

    def wait_ready(self):
        """The machine runs from here on. What was plugged in before is there before its kernel is."""
        self.qmp("cont")
        if self.agent.get("the start") != "ready":
            raise Failure("the agent says something else than that it is ready")

    def ask(self, command):
        """The status and the output of a command inside."""
        self.agent.put(command)
        status, uptime, size = self.agent.get(command).split(" ")
        self.uptime = float(uptime)
        return int(status), self.agent.get_bytes(int(size), command).decode(errors="replace").rstrip("\n")

    def run(self, command):
        """The output of a command inside that must succeed."""
        status, output = self.ask(command)
        if status:
            raise Failure(f"{command}: status {status}\n{output}")
        return output

    def until(self, what, check):
        """Asks again until check(), which runs something inside, says something; returns that."""
        began = None
        pause = 0.1
        while True:
            said = check()
            if said:
                return said
            began = began or self.uptime
            if self.uptime >= began + self.patience:
                raise Failure(f"{what}: not within {self.patience} seconds of the machine")
            # Its clock hardly goes on while it is busy with being asked.
            time.sleep(pause)
            pause = min(2 * pause, 1)

    def until_says(self, command, expected):
        """Runs a command again until its output is this."""
        said = [""]

        def check():
            said[0] = self.ask(command)[1]
            return said[0] == expected
        try:
            self.until(command, check)
        except Failure as failure:
            raise Failure(f"{failure}: it says\n{said[0]}\nand not\n{expected}") from None

    def equals(self, what, command, expected):
        said = self.run(command)
        if said != expected:
            raise Failure(f"{what}: {command} says\n{said}\nand not\n{expected}")

    def device(self, name):
        """The directory of the device with this name, when it has appeared."""
        # Others may go while it is looked for.
        find = f"grep -lxF {name} /sys/bus/usb/devices/*/serial 2>/dev/null"
        return os.path.dirname(self.until(f"{name} appears", lambda: self.ask(find)[1]))

    # Its end.

    def power_off(self):
        self.agent.put("systemctl poweroff")
        self.wait_end()

    def sleep(self, kind="deep"):
        """Returns when the machine sleeps: in memory ("deep"), from which it wakes by wake() or by an alarm of its
        own; or with all frozen and its devices asleep ("s2idle"), from which only its power button wakes it, as QEMU
        has nothing else that interrupts it then."""
        if kind != "deep":
            self.run(f"echo {kind} >/sys/power/mem_sleep; echo 7 >/proc/sys/kernel/printk")
        self.run("systemctl suspend >/run/suspend 2>&1 &")
        if kind == "deep":
            self.wait_event("SUSPEND")
        else:
            self.wait_frozen(kind)

    def wait_frozen(self, kind):
        """Waits until the kernel is in a sleep of that kind: its last words are said, its only processor waits."""
        end = time.monotonic() + FAR
        while not self.is_frozen(kind):
            if time.monotonic() > end:
                raise Failure(f"not in {kind} within {FAR} seconds")
            time.sleep(1)

    def is_frozen(self, kind):
        lines = self.printed()
        entries = [number for number, line in enumerate(lines) if f"PM: suspend entry ({kind})" in line]
        return (entries and lines[-1].endswith("Suspending console(s) (use no_console_suspend to debug)") and
                "HLT=1" in self.qmp("human-monitor-command", **{"command-line": "info registers"}))

    def wake(self, kind="deep"):
        if kind == "deep":
            self.qmp("system_wakeup")
            self.wait_event("WAKEUP")
        else:
            self.qmp("system_powerdown")

    def reset(self):
        """As by its button. Stands still then, until it is waited for: what is plugged in meanwhile is there before
        the kernel is."""
        self.qmp("stop")
        self.qmp("set-action", reboot="reset")
        self.qmp("system_reset")
        self.agent.rest = b""
        self.uptime = 0.0

    def wait_end(self):
        try:
            self.process.wait(FAR)
        except subprocess.TimeoutExpired:
            raise Failure(f"the machine does not end within {FAR} seconds") from None

    def cut_power(self):
        """What has not reached the disk by now never will."""
        self.process.kill()
        self.process.wait()
        self.qmp_end.close()
        self.agent_end.close()

    def printed(self, suffix=""):
        """The lines on the console."""
        path = self.console + suffix
        if not os.path.exists(path):
            return []
        with open(path, "rb") as file:
            return file.read().decode(errors="replace").splitlines()

    def last_words(self):
        """What the console and QEMU said last."""
        return "\n".join(self.printed()[-40:] + self.printed(".qemu")[-40:])


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
            self.machine.cut_power()
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
            story.machine.cut_power()
