#!/usr/bin/env python3
"""Measures the programs end to end, each figure beside a baseline of the same run.

Usage: bench/end_to_end.py [--bin DIR] [--files N] [--gib N] [--pictures N] [--work DIR]
                           [STEP...]

Steps: listing   a folder of N files (100,000) by name and by date, beside find | sort; the
                 same with N/10 files; what the host's memory grows by
       latency   a change on disk until "skein watch" prints it
       unpack    20,000 files unpacked into a watched folder: each told of, none twice
       kill      vald killed during a listing, vald stopped during a command
       import    10,000 files of 4 KiB, then one of 4 GiB (--gib), beside cp -r and a sync; what
                 memory vald and the host took at most
       download  an evicted document of 1 GiB beside cp and sha256sum; how fast a cancelled
                 download ends, and what it leaves
       crowd     64 commands at once on a fresh drive, with vald stopped, and after it goes on
       thumbs    1,000 pictures of about 120 kB each through both sockets, beside one process
                 that reads the stored pictures, and beside cp of them
Without a step: all of them.
"""
import argparse
import json
import os
import pathlib
import shutil
import signal
import statistics
import subprocess
import sys
import tarfile
import tempfile
import time
import zlib


class Drive:
    """A drive in folders of its own, and the programs on it."""

    def __init__(self, top: pathlib.Path, binaries: pathlib.Path):
        self.store = top / "store"
        self.store.mkdir(parents=True)
        self.skein = str(binaries / "skein")
        self.environment = dict(os.environ, SKEIN_STORE=str(self.store), SKEIN_LOG="notice",
                                SKEIN_UPLOADS="2048", NO_COLOR="1")
        for name in ("RUNTIME_DIR", "STATE_HOME", "DATA_HOME", "CONFIG_HOME", "CACHE_HOME"):
            folder = top / name.lower()
            folder.mkdir(mode=0o700)
            self.environment["XDG_" + name] = str(folder)

    def command(self, *arguments, check=True, **options):
        return subprocess.run([self.skein, *arguments], env=self.environment, check=check,
                              **options)

    def status(self):
        answer = self.command("status", "--json", stdout=subprocess.PIPE)
        return json.loads(answer.stdout)

    def wait_until_scanned(self):
        while True:
            status = self.status()
            if status["scan"] == "idle":
                return status
            time.sleep(0.2)

    def stop(self):
        self.command("stop", check=False, stdout=subprocess.DEVNULL)


def seconds(function):
    start = time.perf_counter()
    function()
    return time.perf_counter() - start


def best(function, rounds=5):
    return min(seconds(function) for _ in range(rounds))


def resident(pid):
    for line in open(f"/proc/{pid}/status"):
        if line.startswith("VmRSS:"):
            return int(line.split()[1]) / 1024
    raise RuntimeError(f"process {pid} tells no resident memory")


def make_files(folder: pathlib.Path, count: int):
    folder.mkdir(parents=True)
    for number in range(count):
        with open(folder / f"document {number:06}.txt", "wb") as file:
            file.write(b"x" * (number % 97))


def listing(drive: Drive, options):
    make_files(drive.store / "small", options.files // 10)
    make_files(drive.store / "large", options.files)
    status = drive.wait_until_scanned()
    host = status["hostProcessID"]
    sink = open(os.devnull, "wb")
    times = {}
    for name, count in (("small", options.files // 10), ("large", options.files)):
        baseline = best(lambda: subprocess.run(
            f"find '{drive.store / name}' -maxdepth 1 -printf '%f %s %T@\\n' | sort",
            shell=True, stdout=sink, check=True))
        for order in ("name", "date"):
            drive.command("ls", "--sort", order, "/" + name, stdout=sink)
            before = resident(host)
            took = best(lambda: drive.command("ls", "--sort", order, "/" + name, stdout=sink))
            grown = resident(host) - before
            times[name, order] = took
            print(f"ls by {order}, {count} files: {took:.3f} s; find | sort: {baseline:.3f} s; "
                  f"ratio {took / baseline:.2f}; skein-host grew by {grown:.1f} MB")
    for order in ("name", "date"):
        print(f"ls by {order}, {options.files} over {options.files // 10} files: "
              f"{times['large', order] / times['small', order]:.1f} times")
    listed = drive.command("ls", "/large", stdout=subprocess.PIPE).stdout.splitlines()
    assert listed == sorted(os.fsencode(n) for n in os.listdir(drive.store / "large")), \
        "the listing is not what is on disk"


def watching(drive: Drive, path: str, *arguments):
    watch = subprocess.Popen([drive.skein, "watch", path, "--json", "--ready-fd", "2", *arguments],
                             env=drive.environment, stdout=subprocess.PIPE,
                             stderr=subprocess.PIPE, text=True)
    return watch


def until_ready(watch):
    line = watch.stderr.readline()
    if not line:
        raise RuntimeError("skein watch ended before it began")


def latency(drive: Drive, _options):
    folder = drive.store / "latency"
    folder.mkdir()
    drive.wait_until_scanned()
    watch = watching(drive, "/latency")
    until_ready(watch)
    samples = []
    for number in range(30):
        start = time.perf_counter()
        (folder / f"note {number}").write_text("seen")
        while json.loads(watch.stdout.readline())["name"] != f"note {number}":
            pass
        samples.append(time.perf_counter() - start)
    watch.send_signal(signal.SIGINT)
    watch.wait()
    print(f"a change on disk until skein watch prints it: median "
          f"{statistics.median(samples) * 1000:.0f} ms, worst {max(samples) * 1000:.0f} ms")


def unpack(drive: Drive, _options):
    count = 20_000
    folder = drive.store / "unpacked"
    folder.mkdir()
    archive = drive.store.parent / "archive.tar"
    with tarfile.open(archive, "w") as tar:
        for number in range(count):
            tar.addfile(tarfile.TarInfo(f"member {number:05}"))
    drive.wait_until_scanned()
    watch = watching(drive, "/unpacked")
    until_ready(watch)
    start = time.perf_counter()
    subprocess.run(["tar", "-xf", str(archive), "-C", str(folder)], check=True)
    unpacked = time.perf_counter() - start
    created = {}
    while len(created) < count:
        change = json.loads(watch.stdout.readline())
        if change["change"] == "created":
            assert change["name"] not in created, f"{change['name']} was told of twice"
            created[change["name"]] = change["id"]
    told = time.perf_counter() - start
    watch.send_signal(signal.SIGINT)
    watch.wait()
    assert len(set(created.values())) == count, "two files have one identifier"
    print(f"{count} files unpacked: tar took {unpacked:.2f} s, all told of after {told:.2f} s; "
          f"ratio {told / unpacked:.2f}")


def kill(drive: Drive, options):
    if not (drive.store / "large").exists():
        make_files(drive.store / "large", options.files)
    status = drive.wait_until_scanned()
    vald = status["processID"]
    process = subprocess.Popen([drive.skein, "ls", "/large"], env=drive.environment,
                               stdout=subprocess.PIPE, stderr=subprocess.PIPE)
    process.stdout.read(10_000)
    start = time.perf_counter()
    os.kill(vald, signal.SIGKILL)
    _, error = process.communicate()
    print(f"vald killed during a listing: exit code {process.returncode} after "
          f"{time.perf_counter() - start:.2f} s: {error.decode().strip()}")
    print(f"the next command: {seconds(lambda: drive.command('ls', '/', stdout=subprocess.DEVNULL)):.2f} s")
    status = drive.status()
    vald = status["processID"]
    os.kill(vald, signal.SIGSTOP)
    try:
        for arguments in (["ls", "/"], ["stat", "/large"], ["status"], ["account", "status"],
                          ["doctor"], ["changes", "--since", "initial"]):
            start = time.perf_counter()
            answer = drive.command(*arguments, check=False, stdout=subprocess.DEVNULL,
                                   stderr=subprocess.PIPE)
            print(f"vald stopped: skein {arguments[0]}: exit code {answer.returncode} after "
                  f"{time.perf_counter() - start:.2f} s: {answer.stderr.decode().strip()[:100]}")
    finally:
        os.kill(vald, signal.SIGCONT)


def peak(pid):
    for line in open(f"/proc/{pid}/status"):
        if line.startswith("VmHWM:"):
            return int(line.split()[1]) / 1024
    raise RuntimeError(f"process {pid} tells no peak memory")


def fill(path: pathlib.Path, size: int):
    block = os.urandom(1 << 20)
    with open(path, "wb") as file:
        while size > 0:
            size -= file.write(block[:min(size, len(block))])


def import_files(drive: Drive, options):
    top = drive.store.parent
    small = top / "small"
    for number in range(10_000):
        path = small / f"folder {number // 100}" / f"document {number}"
        path.parent.mkdir(parents=True, exist_ok=True)
        fill(path, 4096)
    large = top / "large"
    fill(large, options.gib << 30)
    subprocess.run(["sync"], check=True)
    status = drive.wait_until_scanned()
    processes = {"vald": status["processID"], "skein-host": status["hostProcessID"]}
    for source, what, rounds in ((small, "10,000 files of 4 KiB", 3),
                                 (large, f"one file of {options.gib} GiB", 3)):
        before = {name: peak(pid) for name, pid in processes.items()}
        copy, took = [], []
        for number in range(rounds):
            target = top / f"copy {number}"
            copy.append(seconds(lambda: subprocess.run(
                ["sh", "-c", 'cp -r "$0" "$1" && sync -f "$1"', str(source), str(target)],
                check=True)))
            drive.command("mkdir", f"/{source.name} {number}")
            took.append(seconds(lambda: drive.command("import", str(source),
                                                      f"/{source.name} {number}")))
        # Not in between: for some seconds after a removal ext4 looks for inodes that were not
        # just used, and whoever comes next pays for it.
        for number in range(rounds):
            subprocess.run(["rm", "-r", str(top / f"copy {number}")], check=True)
            drive.command("rm", "-rf", f"/{source.name} {number}")
        grown = ", ".join(f"{name} {peak(pid):.0f} MB (+{peak(pid) - before[name]:.0f})"
                          for name, pid in processes.items())
        print(f"import of {what}: {min(took):.2f} s; cp -r and sync: {min(copy):.2f} s; "
              f"ratio {min(took) / min(copy):.2f}; peak memory {grown}")


def document(drive: Drive, path: str):
    answer = drive.command("stat", "--json", path, stdout=subprocess.PIPE)
    return json.loads(answer.stdout)


def parts(folder: pathlib.Path):
    return [path for path in folder.rglob("*") if path.name.endswith(".skein-part")]


def download(drive: Drive, _options):
    top = drive.store.parent
    source = top / "movie"
    fill(source, 1 << 30)
    drive.command("import", str(source), "/")
    while not document(drive, "/movie")["uploaded"]:
        time.sleep(0.2)
    subprocess.run(["sync"], check=True)
    copied, synced, took = [], [], []
    for _ in range(3):
        copy = top / "copy"
        for times, command in ((copied, 'cp "$0" "$1" && sha256sum "$1"'),
                               (synced, 'cp "$0" "$1" && sync "$1" && sha256sum "$1"')):
            times.append(seconds(lambda: subprocess.run(
                ["sh", "-c", command, str(source), str(copy)], check=True,
                stdout=subprocess.DEVNULL)))
            copy.unlink()
        drive.command("evict", "/movie")
        took.append(seconds(lambda: drive.command("get", "/movie", stdout=subprocess.DEVNULL)))
    print(f"download of 1 GiB: {min(took):.2f} s; cp and sha256sum: {min(copied):.2f} s, ratio "
          f"{min(took) / min(copied):.2f}; with sync: {min(synced):.2f} s, ratio "
          f"{min(took) / min(synced):.2f}")
    ended, gone = [], []
    for _ in range(5):
        drive.command("evict", "/movie")
        process = subprocess.Popen([drive.skein, "get", "/movie"], env=drive.environment,
                                   stdout=subprocess.DEVNULL)
        while not any(path.stat().st_size > 0 for path in parts(drive.store)):
            time.sleep(0.001)
        start = time.perf_counter()
        process.send_signal(signal.SIGINT)
        assert process.wait() == 130, "skein get was not interrupted"
        ended.append(time.perf_counter() - start)
        while parts(drive.store):
            pass
        gone.append(time.perf_counter() - start)
        assert not document(drive, "/movie")["downloaded"], "the download went on"
        drive.command("get", "/movie", stdout=subprocess.DEVNULL)
    print(f"a cancelled download: the command ended within {max(ended) * 1000:.0f} ms, its part "
          f"was gone within {max(gone) * 1000:.0f} ms")


def crowd(drive: Drive, _options):
    for number in range(8):
        make_files(drive.store / f"folder {number}", 5)
    asked = [["ls", "/folder 3"], ["id", "/folder 1/document 000002.txt"],
             ["stat", "--json", "/folder 2"], ["status", "--json"]]

    def all_at_once():
        start = time.perf_counter()
        # Each waits for its end by itself: files, not pipes, take the output.
        running = []
        for number in range(64):
            output = tempfile.TemporaryFile()
            arguments = asked[number % len(asked)]
            running.append((arguments, output, subprocess.Popen(
                [drive.skein, *arguments], env=drive.environment, stdout=output,
                stderr=subprocess.DEVNULL)))
        answers = []
        for arguments, output, process in running:
            process.wait()
            output.seek(0)
            answers.append((arguments, process.returncode, output.read()))
        return answers, time.perf_counter() - start

    def check(answers):
        identifiers = set()
        for arguments, code, output in answers:
            assert code == 0, f"skein {arguments} ended with {code}"
            if arguments[0] == "ls":
                assert output.split(b"\n")[:-1] == \
                    sorted(os.fsencode(n) for n in os.listdir(drive.store / "folder 3")), output
            elif arguments[0] == "id":
                identifiers.add(output)
            else:
                told = json.loads(output)
                assert arguments[0] == "status" or told["path"] == "/folder 2", output
        assert len(identifiers) == 1, f"one document has {len(identifiers)} identifiers"

    answers, took = all_at_once()
    check(answers)
    print(f"64 commands at once on a fresh drive: all right after {took:.2f} s")
    status = drive.wait_until_scanned()
    os.kill(status["processID"], signal.SIGSTOP)
    try:
        answers, took = all_at_once()
    finally:
        os.kill(status["processID"], signal.SIGCONT)
    codes = sorted({code for _, code, _ in answers})
    print(f"the same with vald stopped: exit codes {codes}, the last after {took:.2f} s")
    answers, took = all_at_once()
    check(answers)
    print(f"the same after it goes on: all right after {took:.2f} s")


def picture(path: pathlib.Path, side: int):
    """A picture of noise: a PNG file without compression, of side x side pixels."""
    rows = b"".join(b"\0" + os.urandom(3 * side) for _ in range(side))

    def chunk(kind, data):
        return (len(data).to_bytes(4, "big") + kind + data +
                zlib.crc32(kind + data).to_bytes(4, "big"))
    path.write_bytes(b"\x89PNG\r\n\x1a\n" + chunk(
        b"IHDR", side.to_bytes(4, "big") * 2 + b"\x08\x02\0\0\0") +
        chunk(b"IDAT", zlib.compress(rows, 0)) + chunk(b"IEND", b""))


def thumbs(drive: Drive, options):
    count = options.pictures
    album = drive.store / "album"
    album.mkdir()
    for number in range(count):
        picture(album / f"picture {number:04}.png", 394)
    paths = [f"/album/picture {number:04}.png" for number in range(count)]
    drive.wait_until_scanned()

    def missing():
        answer = drive.command("thumb", "--json", *paths, check=False, stdout=subprocess.PIPE)
        told = [json.loads(line) for line in answer.stdout.splitlines()]
        assert len(told) == count, f"{len(told)} of {count} were answered"
        return sum(1 for one in told if one["result"] != "thumbnail")
    while left := missing():
        print(f"  {left} pictures are still to be drawn", file=sys.stderr)
        time.sleep(2)
    data = pathlib.Path(drive.environment["XDG_DATA_HOME"])
    # Other documents of the drive have smaller ones.
    stored = sorted((path for path in data.rglob("*") if "thumbnails" in path.parts and
                     path.suffix in (".jpg", ".png")), key=lambda path: path.stat().st_size)
    stored = stored[-count:]
    size = sum(path.stat().st_size for path in stored)
    names = drive.store.parent / "stored"
    names.write_bytes(b"\0".join(os.fsencode(path) for path in stored))
    sink = open(os.devnull, "wb")
    read = best(lambda: subprocess.run(["sh", "-c", 'xargs -0 cat <"$0"', str(names)], check=True,
                                       stdout=sink))
    told = best(lambda: drive.command("thumb", "--json", *paths, stdout=sink))
    target = drive.store.parent / "pictures"

    def fresh(function):
        shutil.rmtree(target, ignore_errors=True)
        target.mkdir()
        return seconds(function)
    copied = min(fresh(lambda: subprocess.run(
        ["sh", "-c", 'xargs -0 cp -t "$1" <"$0"', str(names), str(target)], check=True))
        for _ in range(5))
    written = min(fresh(lambda: drive.command("thumb", "-o", str(target), *paths, stdout=sink))
                  for _ in range(5))
    assert len(list(target.iterdir())) == count
    print(f"thumb of {count} pictures, {size / count / 1000:.0f} kB each: {told * 1000:.0f} ms; "
          f"cat of the stored ones: {read * 1000:.0f} ms, ratio {told / read:.2f}")
    print(f"the same written to a folder: {written * 1000:.0f} ms; cp: {copied * 1000:.0f} ms, "
          f"ratio {written / copied:.2f}")


STEPS = {"listing": listing, "latency": latency, "unpack": unpack, "kill": kill,
         "import": import_files, "download": download, "crowd": crowd, "thumbs": thumbs}


def main():
    top = pathlib.Path(__file__).resolve().parent.parent
    parser = argparse.ArgumentParser(description=__doc__,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--bin", type=pathlib.Path, default=top / "build/release/bin")
    parser.add_argument("--files", type=int, default=100_000)
    parser.add_argument("--gib", type=int, default=4, help="of the large file that is imported")
    parser.add_argument("--pictures", type=int, default=1000)
    parser.add_argument("--work", help="where the drives are made")
    parser.add_argument("steps", nargs="*", choices=[*STEPS, []])
    options = parser.parse_args()
    work = pathlib.Path(tempfile.mkdtemp(prefix="skein-bench-", dir=options.work))
    drive = Drive(work, options.bin.resolve())
    try:
        for step in options.steps or STEPS:
            STEPS[step](drive, options)
    finally:
        drive.stop()
        shutil.rmtree(work)


if __name__ == "__main__":
    sys.exit(main())
