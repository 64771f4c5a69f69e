#!/usr/bin/env python3
"""steady.py IN OUT: steadies a clip; FFmpeg reads and writes it, and the sound stays."""
import json
import subprocess
import sys

import calmframe
import numpy as np

source, target = sys.argv[1:3]
probe = subprocess.run(["ffprobe", "-v", "error", "-select_streams", "v:0", "-show_entries",
                        "stream=width,height,r_frame_rate", "-of", "json", source],
                       check=True, capture_output=True).stdout
stream = json.loads(probe)["streams"][0]
width, height, rate = stream["width"], stream["height"], stream["r_frame_rate"]

# Each frame is needed twice, to be analysed and to be drawn: they stay in memory.
raw = subprocess.run(["ffmpeg", "-v", "error", "-i", source, "-f", "rawvideo", "-pix_fmt", "rgb24",
                      "-"], check=True, capture_output=True).stdout
frames = np.frombuffer(raw, np.uint8).reshape(-1, height, width, 3)

with calmframe.Session(width, height, len(frames), format="rgb", rate=rate) as session:
    for number, frame in enumerate(frames):
        session.push(number, frame)
    session.wait()
    outcome = session.outcome()
    print(f"{outcome['decibels']:.1f} dB calmer, {outcome['width_kept']:.0%} of the width kept")
    writer = subprocess.Popen(["ffmpeg", "-v", "error", "-y", "-f", "rawvideo", "-pix_fmt", "rgb24",
                               "-s", f"{width}x{height}", "-r", rate, "-i", "-", "-i", source,
                               "-map", "0:v", "-map", "1:a?", "-c:a", "copy", target],
                              stdin=subprocess.PIPE)
    for number, frame in enumerate(frames):
        writer.stdin.write(session.render(number, frame))
    writer.stdin.close()
    sys.exit(writer.wait())
