#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Installs the packages of build/packages in a fresh Debian that runs its own systemd in a chroot, follows the README's "Install"
section to a first message, tries what the units forbid, upgrades over a running daemon with a client, follows the README of
fleet/ to what a view answers, removes and purges.
Needs root, cgroup v2 and minutes; fewer with a directory as argument that debootstrap has made before, which is copied. The last
line is "N passed, N failed"."""
import json
import os
import plistlib
import re
import shutil
import subprocess
import sys
import tempfile
import time
from pathlib import Path

SOURCE = Path(__file__).resolve().parents[2]
PACKAGES = ["veltrad", "libveltra8", "libveltra-dev", "veltra-tools", "veltra-lab", "veltra-gateway", "python3-veltra"]
NEEDED = "systemd-sysv dbus gcc libc6-dev pkg-config curl logrotate"
ENGINES = "nginx nats-server postgresql openssl"
DEADLINE = 60

# The namespaces' first process: makes the directory its root and becomes systemd.
BOOT = r"""
mount --make-rprivate / && mount --bind "$0" "$0" && cd "$0"
mount -t proc proc proc && mount -t sysfs sysfs sys && mount -t cgroup2 cgroup2 sys/fs/cgroup
mount -t tmpfs -o mode=755 tmpfs run && mount -t tmpfs -o mode=755 tmpfs dev
for name in null zero full random urandom tty; do touch dev/$name && mount --bind /dev/$name dev/$name; done
mkdir dev/pts dev/shm && mount -t devpts -o newinstance,ptmxmode=0666 devpts dev/pts && ln -s pts/ptmx dev/ptmx
ip link set lo up
mkdir -p run/old && pivot_root . run/old && umount -l run/old
mount --make-rshared /  # for credentials of units; systemd leaves this to who runs a container
exec env -i container=chroot PATH=/usr/sbin:/usr/bin /lib/systemd/systemd
"""


class Box:
    """The Debian in a directory. It has the host's package sources; once booted, a network of its own."""

    def __init__(self, base):
        self.path, self.boot = Path(tempfile.mkdtemp(prefix="box-")), None
        self.path.chmod(0o755)  # its root is for its other users, too
        made = ["debootstrap", "--variant=minbase", self.suite(), str(self.path), *self.mirror()]
        subprocess.run(["cp", "-a", f"{base}/.", str(self.path)] if base else made, check=True, stdout=subprocess.DEVNULL)
        shutil.rmtree(self.path / "etc/apt")
        for folder in ("etc/apt", "usr/share/keyrings"):
            shutil.copytree("/" + folder, self.path / folder, symlinks=True, dirs_exist_ok=True)
        for name in ("etc/hosts", "etc/resolv.conf"):
            shutil.copy("/" + name, self.path / name)
        (self.path / "etc/apt/apt.conf.d/box").write_text('APT::Install-Recommends "false";\n')
        (self.path / "packages").mkdir()

    @staticmethod
    def suite():
        return re.search(r"^VERSION_CODENAME=(.*)$", Path("/etc/os-release").read_text(), re.M)[1]

    @staticmethod
    def mirror():
        """That of the host, if it is easily found."""
        for file in (Path("/etc/apt/sources.list"), *sorted(Path("/etc/apt/sources.list.d").glob("*"))):
            text = file.read_text() if file.exists() else ""
            if found := re.search(r"^(?:URIs:|deb(?: \[.*\])?) +(\S+/debian)/?(?:\s|$)", text, re.M):
                return [found[1]]
        return []

    def start(self):
        groups = re.search(r"^cgroup2 (\S+) ", Path("/proc/mounts").read_text(), re.M)[1]
        self.group = Path(tempfile.mkdtemp(prefix="box-", dir=groups))
        spaces = ["--mount", "--uts", "--ipc", "--net", "--cgroup", "--pid", "--fork", "--kill-child", "--mount-proc"]
        enter = ["sh", "-c", 'echo $$ > "$0/cgroup.procs" && exec "$@"', str(self.group)]
        self.boot = subprocess.Popen([*enter, "unshare", *spaces, "sh", "-e", "-c", BOOT, str(self.path)])
        children = Path(f"/proc/{self.boot.pid}/task/{self.boot.pid}/children")
        wait_until(lambda: children.read_text().strip(), "the first process")
        self.first = children.read_text().split()[0]
        booted = re.compile("running|degraded")
        wait_until(lambda: booted.match(self.run("systemctl is-system-running", check=False)), "the boot")

    def command(self, script, user="root"):
        return ["nsenter", "-t", self.first, "-m", "-u", "-i", "-p", "-n", "-C", "env", "-i", "HOME=/root",
                "PATH=/usr/sbin:/usr/bin:/sbin:/bin", "DEBIAN_FRONTEND=noninteractive", "sh", "-c",
                'exec setpriv --reuid "$0" --regid "$(id -g "$0")" --init-groups sh -e -c "$1"', user,
                f"cd /tmp\n{script}"]

    def run(self, script, check=True, user="root"):
        done = subprocess.run(self.command(script, user), capture_output=True, text=True)
        if check and done.returncode != 0:
            journal = "" if script.startswith("journalctl") else self.run("journalctl -u 'veltra*' -n 30", check=False)
            raise AssertionError(f"status {done.returncode}: {script}\n{done.stdout}{done.stderr}{journal}")
        return done.stdout + done.stderr

    def outside(self, script):
        """In the directory, with the host's network."""
        done = subprocess.run(["chroot", str(self.path), "sh", "-e", "-c", script], capture_output=True, text=True,
                              env={**os.environ, "DEBIAN_FRONTEND": "noninteractive", "LC_ALL": "C"})
        assert done.returncode == 0, f"status {done.returncode}: {script}\n{done.stdout}{done.stderr}"

    def remove(self):
        if self.boot:
            (self.group / "cgroup.kill").write_text("1")
            self.boot.wait()
            wait_until(lambda: "populated 0" in (self.group / "cgroup.events").read_text(), "the end of all processes")
            for group in sorted(self.group.rglob("*/"), reverse=True):
                group.rmdir()
            self.group.rmdir()
        shutil.rmtree(self.path)


def wait_until(condition, what):
    end = time.monotonic() + DEADLINE
    while not condition():
        assert time.monotonic() < end, f"not within {DEADLINE} s: {what}"
        time.sleep(0.1)


class Test:
    def __init__(self, box):
        self.box = box

    def received(self, text):
        events = "curl -s --cacert /etc/veltrad/ca.pem 'https://localhost:8443/received?kind=events'"
        wait_until(lambda: text in self.box.run(events), f"an event with {text}")

    def test_install(self):
        for package in (SOURCE / "build/packages").glob("*.deb"):
            shutil.copy(package, self.box.path / "packages")
        get = "apt-get install -q -y"
        self.box.outside(f"apt-get update -q && {get} {NEEDED} && {get} --download-only /packages/*.deb {ENGINES}")
        self.box.start()
        self.box.run(f"{get} /packages/*.deb")
        expected = {"/etc/veltrad": "755 root:root", "/var/lib/veltrad": "750 veltrad:veltrad",
                    "/var/log/veltrad": "750 veltrad:veltrad",
                    "/var/mobile/Library/Logs/Zentrel/Retired": "750 veltrad:veltrad",
                    "/etc/veltrad/policy.json": "644 root:root",
                    "/run/veltrad/com.florn.veltrad.sock": "666 root:root"}
        found = self.box.run(f"stat -c '%n %a %U:%G' {' '.join(expected)}").splitlines()
        assert found == [f"{path} {rights}" for path, rights in expected.items()], found
        assert "nologin" in self.box.run("getent passwd veltrad")
        assert self.box.run("systemctl is-enabled veltra-lab || true") == "disabled\n"
        exposure = self.box.run("systemd-analyze security --no-pager veltrad.service").splitlines()[-1]
        assert float(re.search(r"\d+\.\d+", exposure)[0]) <= 1.6, exposure

    def test_links_of_documents(self):
        """Each leads to a file of the same package."""
        links = 0
        for package in PACKAGES:
            files = set(self.box.run(f"dpkg -L {package}").splitlines())
            for name in (name for name in files if name.endswith((".md", ".html"))):
                text = re.sub(r"^```.*?^```$", "", (self.box.path / name[1:]).read_text(), flags=re.M | re.S)
                for link in re.findall(r"""\]\(([^)\s]+)|(?:href|src)="([^"]+)""", text):
                    path = "".join(link).split("#")[0]
                    links += not re.match("[a-z]+:", path)
                    assert re.match("[a-z]+:|$", path) or os.path.normpath(f"{name}/../{path}") in files, f"{name}: {path}"
        assert links > 100, links

    def test_first_message_by_the_readme(self):
        section = re.search(r"^## Install\n(.*?)^## ", (SOURCE / "README.md").read_text(), re.M | re.S)[1]
        set_up, report = re.findall(r"^```sh\n(.*?)^```$", section, re.M | re.S)[-2:]
        consent = "veltractl config set DiagnosticLogSubmissionEnabled true"
        self.box.run(set_up.replace(consent + "\n", ""))
        doctor = json.loads(self.box.run("veltractl doctor --client-type 7 --json", check=False))
        assert consent in next(check["mend"] for check in doctor["checks"] if check["name"] == "consent"), doctor
        assert "policy_consent" in self.box.run("veltractl send --client-type 7 --category 5 --type 1", check=False)
        assert consent in set_up
        self.box.run(consent)
        self.box.run(report)
        self.received('"_method":5')
        assert "User=veltrad" in self.box.run("systemctl show -p User veltrad")
        assert '"kind":"post"' in self.box.run("veltractl history --json")
        stats = "veltractl stats --json"  # which everybody may read
        wait_until(lambda: "message taken in" in self.box.run(stats, check=False, user="nobody"), "the counters")

    def test_python_tools_and_reload(self):
        preferences = self.box.path / "var/lib/veltrad/preferences/com.florn.veltra.plist"
        preferences.write_bytes(plistlib.dumps({**plistlib.loads(preferences.read_bytes()),
                                                "DiagnosticLogSubmissionEnabled": True}))
        self.box.run("sed -i '/override_dnu/d' /var/lib/veltra-lab/storebags/quindle.json\n"  # consent, and a readable copy
                     "systemctl set-environment LANG=en_US.UTF-8; systemctl restart veltrad")
        self.box.run("""python3 -c '
import veltra
with veltra.Session(client_type=7, client_name="phone", service_name="snake", require_user_info=True) as session:
    assert session.start() == ["httppost"]
    assert session.send(5, 77)'""")
        self.received('"_status":77')
        self.box.run("""python3 /usr/share/doc/python3-veltra/examples/phone_test.py
echo '#include <veltra/testing.h>
int main(void) { veltra_testing_stop(veltra_testing_start(NULL)); }' | cc -x c - $(pkg-config --libs veltra-testing) && ./a.out""")
        log = self.box.run("stat -c '%a %U:%G' /var/mobile/Library/Logs/Zentrel/Retired/*").strip()
        assert log == "640 veltrad:veltrad", log
        self.box.run("veltra-storebag keygen keys; logrotate --debug /etc/logrotate.d/veltrad")
        for program in ("veltractl", "veltra-storebag", "veltra-lab", "/usr/libexec/veltrad"):
            assert re.fullmatch(rf"{Path(program).name} 8\.\d\S*\n", self.box.run(f"{program} --version")), program
        process = self.box.run("systemctl show -p MainPID veltrad")
        self.box.run("systemctl reload veltrad")
        assert self.box.run("systemctl show -p MainPID veltrad") == process

    def test_an_entitlement_of_a_unit(self):
        """The daemon must see, in spite of its unit's restrictions, to which unit another user's process belongs."""
        rules = self.box.path / "etc/veltrad/entitlements.json"
        kept = rules.read_text()
        rules.write_text(kept.replace('"uid": 0', '"unit": "sender.service"'))
        send = "veltractl send --client-type 7 --category 5 --type"
        assert "entitle" in self.box.run(f"{send} 80", check=False)
        self.box.run(f"systemd-run --wait --collect --unit=sender --uid=nobody {send} 81")
        self.received('"_status":81')
        rules.write_text(kept)

    def test_an_adaptor(self):
        """The daemon must load the bundle, and the bundle write its file, in spite of the unit's restrictions."""
        document = (SOURCE / "docs/adaptor.md").read_text()
        bundle = re.search(r"^(/System/\S+\.so)$", document, re.M)[1]
        self.box.run(f"mkdir -p {Path(bundle).parent}\n"
                     f"cc -shared -fPIC /usr/share/doc/libveltra-dev/examples/adaptor.c -o {bundle}\n"
                     """sed -i 's/"release": {/"release": {"mivo": {},/' /var/lib/veltra-lab/storebags/quindle.json\n"""
                     "systemctl restart veltrad\n"
                     "veltractl send --client-type 7 --category 5 --type 84 codec=opus")
        written = self.box.path / "var/log/veltrad/example-adaptor.jsonl"
        wait_until(lambda: written.exists() and '{"method":5,"respCode":84,"dict":{"codec":"opus"}}' in written.read_text(),
                   "a line of the adaptor")
        self.received('"_status":84')
        shutil.rmtree(self.box.path / "System")

    def test_the_gateway(self):
        """Its units run in spite of their restrictions, as users of their own, also before there is a stream or a database, and read
        the credentials that they are given."""
        self.box.run("mkdir -m 700 /srv/secrets; (umask 077; echo name:password > /srv/secrets/stream)")
        for unit, user, port in (("veltra-gateway", "veltra-gateway|6[0-9]{4}", 8081), ("veltra-gateway-drain", "veltra-drain", 8082)):
            assert self.box.run(f"systemctl is-enabled {unit} || true") == "disabled\n"
            options = f"/run/systemd/system/{unit}.service.d"
            self.box.run(f"mkdir -p {options}; (echo '[Service]\nLoadCredential=stream:/srv/secrets/stream\nExecStart='\n"
                         f"sed -n 's|^ExecStart=.*|& --credentials %d/stream|p' /lib/systemd/system/{unit}.service) > {options}/credentials.conf\n"
                         f"systemctl daemon-reload; systemctl start {unit}")
            asked = "for path in live ready; do curl -s -o /dev/null -w '%{http_code} ' http://127.0.0.1:" + f"{port}/$path; done"
            assert self.box.run(asked) == "200 503 ", unit
            found = self.box.run(f"ps -o user:32= -p $(systemctl show -P MainPID {unit})").strip()
            assert re.fullmatch(user, found), found
            exposure = self.box.run(f"systemd-analyze security --no-pager {unit}.service").splitlines()[-1]
            assert float(re.search(r"\d+\.\d+", exposure)[0]) <= 2.0, exposure
            self.box.run(f"systemctl stop {unit}; rm -r {options}; systemctl daemon-reload")
        files = self.box.run("stat -c '%a %U:%G' /var/lib/veltra-drain")
        assert files == "750 veltra-drain:veltra-drain\n", files

    def test_upgrade_over_a_running_daemon(self):
        client = subprocess.Popen(self.box.command("exec veltractl session --client-type 7"), stdin=subprocess.PIPE,
                                  stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True)
        assert "httppost" in client.stdout.readline()
        client.stdin.write('{"op":"send","category":5,"type":82}\n')
        client.stdin.flush()
        assert "send" in client.stdout.readline()
        for package in sorted((self.box.path / "packages").glob("*.deb")):
            tree = self.box.path / "packages/tree"
            subprocess.run(["dpkg-deb", "--raw-extract", package, tree], check=True)
            control = tree / "DEBIAN/control"
            control.write_text(control.read_text().replace("8.0-1", "8.0-2"))
            subprocess.run(["dpkg-deb", "--root-owner-group", "--build", tree, package], check=True,
                           stdout=subprocess.DEVNULL)
            shutil.rmtree(tree)
        before, lab = (self.box.run(f"systemctl show -p MainPID {unit}") for unit in ("veltrad", "veltra-lab"))
        self.box.run("apt-get install -q -y /packages/*.deb")
        assert "8.0-2" in self.box.run("dpkg-query -W veltrad")
        client.communicate(timeout=DEADLINE)  # it ends, whether or not the daemon that it knew has ended
        self.received('"_status":82')  # and what it had sent was reported before that
        self.box.run("veltractl send --client-type 7 --category 5 --type 83")
        self.received('"_status":83')
        assert self.box.run("systemctl show -p MainPID veltrad") != before
        assert self.box.run("systemctl show -p MainPID veltra-lab") == lab != "MainPID=0\n"
        assert (self.box.path / "etc/veltrad/ca.pem").exists()

    def test_a_query_by_the_readme_of_fleet(self):
        """From packages to what a view answers, by the commands of the section alone."""
        section = re.search(r"^## On one machine, from packages\n(.*?)^## ", (SOURCE / "fleet/README.md").read_text(), re.M | re.S)[1]
        install, *steps, query = re.findall(r"^```sh\n(.*?)^```$", section, re.M | re.S)
        for step in (install, *steps):
            self.box.run(f"cd /packages\n{step}")
        wait_until(lambda: "(1 row)" in self.box.run(query), "the event in a view")
        processes = "systemctl show -P MainPID veltra-gateway veltra-gateway-drain"
        before = self.box.run(processes).split()
        self.box.run("apt-get install -q -y --reinstall /packages/veltra-gateway_*.deb")
        assert not {"0", *before} & set(self.box.run(processes).split()), "an upgrade lets the old program run"

    def test_remove_and_purge(self):
        self.box.run("apt-get remove -q -y " + " ".join(PACKAGES))
        for unit in ("veltrad.service", "veltrad.socket", "veltra-gateway", "veltra-gateway-drain", "veltra-lab"):
            assert self.box.run(f"systemctl is-active {unit}", check=False) == "inactive\n", unit
        assert not (self.box.path / "usr/libexec/veltrad").exists()
        assert (self.box.path / "etc/veltrad/ca.pem").exists(), "removal alone keeps the configuration"
        self.box.run("dpkg --purge " + " ".join(PACKAGES))
        self.box.run("rm -r /srv/veltra /etc/systemd/system/veltra-gateway*.service.d /etc/postgresql/15/main/conf.d/veltra.conf")
        left = self.box.run("find / /run -xdev -name '*veltra*' -not -path '/packages/*' -o -xdev -name mobile").split()
        assert not left, left
        assert "0 loaded" in self.box.run("systemctl list-units --failed 'veltra*'")


def main():
    if os.getuid() != 0:
        sys.exit("tests/packaging/run.py: needs root, for debootstrap and chroot")
    if not list((SOURCE / "build/packages").glob("*.deb")):
        sys.exit("tests/packaging/run.py: no packages in build/packages; run scripts/package first")
    box, passed = Box(*(sys.argv[1:2] or [None])), 0
    tests = [name for name in vars(Test) if name.startswith("test_")]
    try:
        for name in tests:  # each goes on where the one before ended
            getattr(Test(box), name)()
            passed += 1
            print(f"{name}: passed", flush=True)
    except (AssertionError, OSError, subprocess.SubprocessError) as error:
        print(f"{name}: failed: {error}", flush=True)
    finally:
        box.remove()
    print(f"{passed} passed, {len(tests) - passed} failed")
    sys.exit(passed != len(tests))


main()
