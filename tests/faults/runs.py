"""What the drivers of this folder share: small clips, runs of the program with faults_preload before it, and what a run left."""
import json
import os
import pathlib
import resource
import re
import shutil
import signal
import sqlite3
import subprocess

PATIENCE = 60  # seconds on the clock, of a run that takes some tenths of one
CODES = {0, 3, 4, 5, 6}
STATE_BYTES = 4096


def make_clip(path, seed, size="96x64", frames=12):
    """Frames that shake, with sound."""
    subprocess.run(["ffmpeg", "-v", "error", "-nostdin", "-y", "-f", "lavfi", "-i",
                    f"testsrc2=s={size}:r=25,rotate=0.05*sin(n/2+{seed}):fillcolor=gray", "-f", "lavfi", "-i", f"sine={440 + seed}",
                    "-frames:v", str(frames), "-t", str(frames / 25), "-c:v", "libx264", "-preset", "ultrafast", "-pix_fmt", "yuv420p",
                    "-c:a", "aac",
                    "-fflags", "+bitexact", path], check=True)


def function_at(path, offset):
    """Whose code that is, as the file's symbols tell; empty where they don't, or nothing reads them."""
    try:
        words = ["addr2line", "-Cf", "-e", path, hex(int(offset, 16) - 1)]
        return subprocess.run(words, stdout=subprocess.PIPE, check=False).stdout.decode()
    except FileNotFoundError:
        return ""


def grey(path):
    """The frames of a clip, a byte a pixel; empty where it doesn't decode."""
    shown = subprocess.run(["ffmpeg", "-v", "error", "-xerror", "-nostdin", "-i", path, "-map", "0:v", "-f", "rawvideo", "-pix_fmt",
                            "gray", "-"], stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, check=False)
    return shown.stdout if shown.returncode == 0 else b""


class Ended:
    def __init__(self, code, said, seconds):
        self.code, self.said, self.seconds = code, said, seconds
        self.lines = [line for line in said.splitlines() if line.strip()]

    @property
    def last_line(self):
        return self.lines[-1] if self.lines else ""


def empty(folder):
    folder.mkdir(exist_ok=True)
    for path in folder.iterdir():
        shutil.rmtree(path) if path.is_dir() else path.unlink()


class Place:
    """A folder that stands as `make` (a function of the folder) had it whenever a run begins."""

    def __init__(self, scratch, preload):
        self.scratch = pathlib.Path(scratch)
        self.preload = preload
        self.folder = self.scratch / "run"
        self.kept = self.scratch / "kept"
        self.state = self.scratch / "state"
        self.out = self.scratch / "out"
        self.said = self.scratch / "said"

    def keep(self):
        """What is there now is what reset() brings back."""
        shutil.rmtree(self.kept, ignore_errors=True)
        shutil.copytree(self.folder, self.kept, copy_function=shutil.copy2)

    def reset(self):
        shutil.rmtree(self.folder, ignore_errors=True)
        shutil.copytree(self.kept, self.folder, copy_function=shutil.copy2)

    def start(self, words, mode=None, **faults):
        self.state.write_bytes(bytes(STATE_BYTES))
        # What faults_preload writes of a run lies outside of what a bounded one reaches.
        environment = dict(os.environ, CALMFRAME_NO_SANDBOX="1")
        if mode:
            self.out.unlink(missing_ok=True)
            environment.update(LD_PRELOAD=str(self.preload), FAULTS_STATE=str(self.state), FAULTS_MODE=mode,
                               FAULTS_OUT=str(self.out), FAULTS_ROOT=str(self.folder.resolve()),
                               **{f"FAULTS_{name.upper()}": str(value) for name, value in faults.items()})
        with open(self.said, "wb") as said:
            return subprocess.Popen([str(word) for word in words], cwd=self.folder, env=environment, stdin=subprocess.DEVNULL,
                                    stdout=said, stderr=said, start_new_session=True)

    def end(self, process, patience=PATIENCE):
        before = resource.getrusage(resource.RUSAGE_CHILDREN)
        try:
            code = process.wait(patience)
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait()
            code = "no end"
        after = resource.getrusage(resource.RUSAGE_CHILDREN)
        return Ended(code, self.said.read_text(errors="replace"), after.ru_utime + after.ru_stime - before.ru_utime - before.ru_stime)

    def run(self, words, mode=None, **faults):
        return self.end(self.start(words, mode, **faults))

    def processes(self):
        """Those of the run, gone or not."""
        count = int.from_bytes(self.state.read_bytes()[36:40], "little")
        return [int.from_bytes(self.state.read_bytes()[n:n + 4], "little") for n in range(40, 40 + 4 * min(count, 64), 4)]

    def count(self, number):
        """A number of faults_preload's State: 0 calls of the place, 1 calls that failed, 2 changes."""
        return int.from_bytes(self.state.read_bytes()[8 * number:8 * number + 8], "little")


def how(code):
    if isinstance(code, int) and code < 0:
        return "signal " + signal.Signals(-code).name
    return str(code)


def rows_of(path, masks=True):
    """All rows of a project, as they are after what SQLite does with a transaction that was cut; a text where it is none. The
    results name the moment that they were made, and a number of the effect's counts what it told its host, so two runs differ there: with
    `masks` these and the sum of all are left out."""
    try:
        database = sqlite3.connect(path)
        try:
            rows = "\n".join(database.iterdump())
            return re.sub(r"X'[0-9A-F]+'|'checksum','[^']*'|\(1,302,[0-9.]+\)", "-", rows) if masks else rows
        finally:
            database.close()
    except sqlite3.Error as error:
        return f"no project: {error}"


def is_project(path):
    return path.suffix == ".calm"


def is_part(name):
    """Whether a name, or one of its folders', tells that what is there is not whole."""
    return name.endswith("-journal") or any(part.endswith(".part") or part.startswith(".") and part != ".calmframe"
                                            for part in pathlib.PurePath(name).parts)


class Contents:
    """What stands under final names: bytes of outputs, rows of projects. Pages and records differ from run to run by their times."""

    def __init__(self, folder):
        self.files, self.parts = {}, []
        for path in sorted(p for p in folder.rglob("*") if not p.is_dir()):
            name = str(path.relative_to(folder))
            if is_part(name):
                self.parts.append(name)
            elif ".calmframe/" in name or path.suffix == ".html":
                if not is_whole_text(path):
                    self.files[name] = "half"
            elif is_project(path):
                self.files[name] = rows_of(path)
            else:
                self.files[name] = path.read_bytes()


def is_whole_text(path):
    if path.suffix == ".html":
        return path.read_bytes().rstrip().endswith(b"</html>")
    if path.suffix == ".json":
        try:
            json.loads(path.read_bytes())
        except ValueError:
            return False
    return True


PROJECT = "work.calm"
# libx264 takes what its look-ahead finds in memory that it never wrote into account, so its bits differ from run to run; not so
# without one.
SAME_BITS = ["--preset", "ultrafast"]


def commands(program, library_calls):
    """Name: the commands before, the command."""
    def stabilize(out, *flags):
        return [program, "stabilize", "a.mp4", out, "--project", PROJECT, "--quiet", "--threads", "2", *SAME_BITS, *flags]
    def analyze(*flags):
        return [program, "analyze", "a.mp4", "--project", PROJECT, "--quiet", "--threads", "2", *flags]
    table = {
        "analyze": ([], analyze()),
        "stabilize": ([], stabilize("out.mp4")),
        # Over a project and an output of other controls.
        "save-over": ([stabilize("out.mp4")], stabilize("out.mp4", "--smoothness", "90", "--overwrite")),
        "render": ([analyze("--choose")],
                   [program, "render", "--project", PROJECT, "out.mp4", "--quiet", "--threads", "2", "--overwrite", *SAME_BITS]),
        "load": ([analyze()], [program, "info", PROJECT]),
        "tracks": ([analyze()], [program, "tracks", PROJECT, "out.trk", "--overwrite"]),
        "report": ([analyze("--choose")], [program, "report", PROJECT, "out.html", "--overwrite", "--quiet"]),
        "pictures": ([], [program, "stabilize", "a.mp4", "pictures/", "--quiet", "--threads", "2", "--overwrite"]),
        "batch": ([], [program, "batch", "a.mp4", "b.mp4", "--to", "steady", "--jobs", "2", "--quiet", *SAME_BITS]),
    }
    if library_calls:
        table["library"] = ([], [library_calls, PROJECT])
    return table
