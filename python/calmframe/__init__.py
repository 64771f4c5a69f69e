"""Steadies shaky video whose frames are numpy arrays.

A session is one clip. Its frames are pushed in order, or fetched by a function; then any of them can be
drawn steady, in any order and from several threads:

    with calmframe.Session(width, height, len(frames), format="rgb", rate=30) as session:
        for number, frame in enumerate(frames):
            session.push(number, frame)
        session.wait()
        steady = [session.render(number, frame) for number, frame in enumerate(frames)]

Any number of sessions may be open at once. Failures raise Error, whose `code` is a name such as
"CALMFRAME_ERROR_SOLVE"; arrays of a wrong shape or type raise ValueError.
"""

import atexit
import ctypes
import json
import os
import weakref
from fractions import Fraction
from typing import Any, Callable, Dict, List, Optional, Sequence, Tuple, Union

import numpy as np

from . import _calmframe

__all__ = ["Error", "Frame", "Session", "version"]

Error = _calmframe.Error
version = _calmframe.version

#: A packed frame is an array (height, width, components) of uint8, uint16 (0 to 65535) or float32 (0 to
#: 1), for a depth of 8, 16 or 32. A planar one is a tuple of three arrays (rows, columns), luma first, of
#: uint8 or, for depths of 10, 12 and 16, uint16 with the value in the lower bits.
Frame = Union[np.ndarray, Tuple[np.ndarray, np.ndarray, np.ndarray]]

#: What is open is closed before the interpreter goes, which a fetching thread may be waiting for.
_open: "weakref.WeakSet[Session]" = weakref.WeakSet()


@atexit.register
def _close_all() -> None:
    for session in list(_open):
        session.close()


_FORMATS = {"rgba": (0, 4), "bgra": (1, 4), "argb": (2, 4), "rgb": (3, 3), "bgr": (4, 3)}
_PLANAR = {"yuv420p": (5, 2, 2), "yuv422p": (6, 2, 1), "yuv444p": (7, 1, 1)}
_STATES = ("idle", "working", "solved", "failed", "cancelled")
_PATH = np.dtype([("before", "f8", 4), ("after", "f8", 4), ("zoom", "f8"), ("black", "f8"),
                  ("centre", "f8", 2), ("least", "f8", 2), ("most", "f8", 2)])


class Session:
    """A clip of `frame_count` frames of `width` x `height` pixels, at least 20 each.

    Where frames are pushed, `frame_count` is how many there are at most: finish() may come earlier.

    format: "rgba", "bgra", "argb", "rgb", "bgr", "yuv420p", "yuv422p" or "yuv444p"; see Frame.
    depth: bits of a component.
    rate: frames a second, a number, a Fraction or a text such as "30000/1001".
    aspect: width : height of one pixel, as `rate`.
    shots: "one", "found" (takes `fetch`), the first frames of all shots but the first, or None: found
        where frames are fetched, else one.
    fetch: a function that takes a frame's number and gives the Frame. It is called on threads of the
        session's, one call at a time, in order while the clip is worked. What it raises ends the work.
    matrix, full_range, chroma_location: what YUV means, code points of ITU-T H.273; 2 is told by the
        size. chroma_location: 1 left, 2 centre, 3 top left.
    field_order: 0 progressive, 1 the top field first, 2 the bottom field.
    clip: the file that the frames come from, for projects that are exchanged with the program.
    identity: any text that is the same for the same frames.
    plugin: calmframe.hxp, where it is not where it was installed.
    """

    def __init__(self, width: int, height: int, frame_count: int, *, format: str = "rgba",
                 depth: int = 8, rate: Union[int, float, str, Fraction] = 25,
                 aspect: Union[int, float, str, Fraction] = 1,
                 shots: Union[None, str, Sequence[int]] = None,
                 fetch: Optional[Callable[[int], Frame]] = None, matrix: int = 2,
                 full_range: bool = False, chroma_location: int = 1, field_order: int = 0,
                 clip: Optional[str] = None, identity: Optional[str] = None,
                 plugin: Optional[str] = None) -> None:
        if format not in _FORMATS and format not in _PLANAR:
            raise ValueError(f"format {format!r} is none of {', '.join([*_FORMATS, *_PLANAR])}")
        if format in _FORMATS:
            number, components = _FORMATS[format]
            self._shapes = [(height, width, components)]
        else:
            number, across, down = _PLANAR[format]
            self._shapes = [(height, width)] + 2 * [(height // down, width // across)]
        self._type = np.dtype({8: np.uint8, 32: np.float32}.get(depth, np.uint16))
        self._packed = format in _FORMATS
        self._fetch = fetch
        rate, aspect = (Fraction(x).limit_denominator(1 << 20) for x in (rate, aspect))
        options: Dict[str, Any] = {
            "width": width, "height": height, "frame_count": frame_count, "format": number,
            "depth": depth, "rate_num": rate.numerator, "rate_den": rate.denominator,
            "aspect_num": aspect.numerator, "aspect_den": aspect.denominator, "matrix": matrix,
            "full_range": int(full_range), "chroma_location": chroma_location,
            "field_order": field_order}
        kinds = {None: 0, "one": 1, "found": 2}
        if shots is None or isinstance(shots, str):
            if shots not in kinds:
                raise ValueError(f"shots {shots!r} is none of one, found, or a list")
            options["shots"] = kinds[shots]
        else:
            options["shots"], options["shot_starts"] = 3, [int(start) for start in shots]
        for name, text in (("clip", clip), ("identity", identity), ("plugin", plugin)):
            if text is not None:
                options[name] = os.fspath(text)
        self._session = _calmframe.Session(options, self._fill if fetch else None)
        _open.add(self)

    def __enter__(self) -> "Session":
        return self

    def __exit__(self, *_: Any) -> None:
        self.close()

    def close(self) -> None:
        """Ends the work, wherever it is, and the session."""
        self._session.close()

    def set(self, name: str, value: Union[str, float, bool]) -> None:
        """Sets a control, to be had with the next start(), or first push().

        Names and values are those of `calmframe params` ("Smoothness", 80), and "window",
        "zoom-at-most", "zoom-speed", "steady" and "as-set" of `calmframe stabilize`."""
        if isinstance(value, bool):
            value = "on" if value else "off"
        self._session.set(name, value if isinstance(value, str) else format(value, "g"))

    def controls(self) -> List[Dict[str, Any]]:
        """All controls of the effect, each with its name, range, default and present value."""
        return json.loads(self._session.controls())

    def start(self) -> None:
        """Begins the work, or does anew what other controls ask for."""
        self._session.start()

    def push(self, number: int, frame: Frame) -> None:
        """Gives the next frame; waits while the analysis is some frames behind."""
        self._session.push(number, self._planes(frame), True)

    def try_push(self, number: int, frame: Frame) -> bool:
        """The same without waiting: False, and the frame was not taken, where there is no room."""
        return self._session.push(number, self._planes(frame), False)

    def finish(self) -> None:
        """There are no more frames than were pushed."""
        self._session.finish()

    def wait(self, timeout: Optional[float] = None) -> bool:
        """Waits until the clip is solved; False where `timeout` seconds are up before."""
        left = None if timeout is None else max(0, round(1000 * timeout))
        while True:  # in steps, between which Python sees to an interrupt
            step = 100 if left is None else min(left, 100)
            if self._session.wait(step):
                return True
            if left is not None:
                left -= step
                if left <= 0:
                    return False

    def solve(self) -> None:
        """start() and wait()."""
        self.start()
        self.wait()

    def cancel(self) -> None:
        """Ends the work at its next step."""
        self._session.cancel()

    @property
    def state(self) -> str:
        """"idle", "working", "solved", "failed" or "cancelled"."""
        return _STATES[self._session.state()]

    @property
    def progress(self) -> Dict[str, Any]:
        """"stage", "shot" from 0, "done" of "total" (frames while analysing), and what it "says"."""
        return self._session.progress()

    def shots(self) -> List[Dict[str, Any]]:
        """Each shot: "first", "end" (excluded), "solved", and the members of outcome()."""
        return self._session.shots()

    def outcome(self) -> Dict[str, Any]:
        """What the clip shows: "window", "bends", "width_kept" (0 to 1), "most_zoom", "most_black" (0 to
        1), "decibels" by which the shake has fallen, shake "before" and "after" in thousandths of the
        width ("mean", "p95", "worst", "worst_at" in seconds), wobble and the shake of tracks."""
        return self._session.outcome()

    def path(self, first: int = 0, count: Optional[int] = None) -> np.ndarray:
        """The path of the frames from `first` on: a structured array (count,) in square pixels about the
        frame's middle, y down.

        before, after: (a, b, dx, dy), which takes a background point (x, y) to its place in the frame
            before, (a x - b y + dx, b x + a y + dy), as filmed and as shown; no meaning of a shot's first.
        zoom: how many times enlarged. black: share of the frame that shows nothing, 0 to 1.
        centre: of the window in the source's frame. least, most: how far it may go within the frame."""
        if count is None:
            count = self.shots()[-1]["end"] - first
        return self._session.path(first, count).view(_PATH).reshape(count)

    def report(self) -> Dict[str, Any]:
        """The outcome, warnings, and for each shot what was chosen of what."""
        return json.loads(self._session.report())

    def render(self, number: int, source: Optional[Frame] = None,
               out: Optional[Frame] = None) -> Frame:
        """Draws a frame steady, into `out` where it is given. `source`: the frame as it was shot; None:
        it is fetched. Any number of threads at once."""
        if out is None:
            planes = [np.empty(shape, self._type) for shape in self._shapes]
        else:
            planes = self._planes(out)
            mine = [out] if self._packed else list(out)
            if any(a is not b for a, b in zip(planes, mine)) or not all(
                    plane.flags.writeable for plane in planes):
                raise ValueError("out must be writable, with its pixels side by side")
        self._session.render(number, None if source is None else self._planes(source), planes)
        return planes[0] if self._packed else tuple(planes)

    def save(self, path: Optional[str] = None) -> Optional[bytes]:
        """Saves what was solved to a project file, or gives it as bytes."""
        if path is None:
            return self._session.save()
        self._session.save_file(os.fspath(path))
        return None

    def load(self, saved: Union[bytes, str]) -> None:
        """Takes up saved work, bytes or a project file, before any start or push."""
        if isinstance(saved, (bytes, bytearray)):
            self._session.load(bytes(saved))
        else:
            self._session.load_file(os.fspath(saved))

    def _planes(self, frame: Frame) -> List[np.ndarray]:
        planes = [frame] if self._packed else list(frame)
        if len(planes) != len(self._shapes):
            raise ValueError(f"{len(planes)} planes, not {len(self._shapes)}")
        checked = []
        for plane, shape in zip(planes, self._shapes):
            if not isinstance(plane, np.ndarray) or plane.shape != shape or plane.dtype != self._type:
                told = f"{plane.dtype} {plane.shape}" if isinstance(plane, np.ndarray) else type(plane)
                raise ValueError(f"a frame's array is {self._type} {shape}, not {told}")
            inner = plane.strides[1:] == np.empty(shape[1:], self._type).strides
            row = shape[1] * (shape[2] if self._packed else 1) * self._type.itemsize
            held = inner and abs(plane.strides[0]) >= row and (self._packed or plane.strides[0] > 0)
            checked.append(plane if held else np.ascontiguousarray(plane))
        return checked

    def _fill(self, number: int, places: List[Tuple[int, int]]) -> None:
        for plane, (address, stride) in zip(self._planes(self._fetch(number)), places):
            bytes_of = (ctypes.c_byte * (stride * plane.shape[0])).from_address(address)
            rows = np.frombuffer(bytes_of, np.uint8).reshape(plane.shape[0], stride)
            row = plane.nbytes // plane.shape[0]
            rows[:, :row] = np.ascontiguousarray(plane).view(np.uint8).reshape(-1, row)
