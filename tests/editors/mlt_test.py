"""The MLT filter as melt runs it: equal to the program, and harmless where something is wrong.

mlt_test.py PROGRAM MODULE METADATA
"""
import hashlib
import os
import re
import resource
import shutil
import signal
import subprocess
import sys
import tempfile
import unittest

import numpy as np

PROGRAM = MODULE = METADATA = ""  # paths
WIDTH, HEIGHT, FRAMES, RATE = 192, 144, 30, 25


def wall(number):
    """A patterned wall before a camera that trembles."""
    y, x = np.mgrid[0:HEIGHT, 0:WIDTH].astype(np.float64)
    x += 6 * np.sin(2.1 * number)
    y += 5 * np.sin(1.7 * number + 1)
    waves = [np.sin(x / a) * np.cos(y / b) for a, b in ((3.1, 4.3), (7.7, 5.9), (13.0, 17.0))]
    grey = (127 + 40 * sum(waves)).astype(np.uint8)
    return np.repeat(grey[:, :, None], 3, 2)


class MltTest(unittest.TestCase):
    def setUp(self):
        self.folder = tempfile.mkdtemp()
        self.addCleanup(shutil.rmtree, self.folder, True)
        self.env = dict(os.environ, MLT_REPOSITORY=self.place("modules"), MLT_DATA=self.place("data"))
        self.env.pop("MLT_PROFILE", None)
        os.mkdir(self.place("modules"))
        os.mkdir(self.place("data"))
        for variable, found in (("modules", "moduledir"), ("data", "mltdatadir")):
            installed = subprocess.check_output(
                ["pkg-config", "--variable=" + found, "mlt-framework-7"], text=True).strip()
            for name in os.listdir(installed):
                # What plays and encodes files, without windows.
                if variable == "data" or name in ("libmltcore.so", "libmltavformat.so", "libmltxml.so",
                                                  "libmltnormalize.so", "libmltplus.so"):
                    os.symlink(os.path.join(installed, name), self.place(variable, name))
        os.symlink(MODULE, self.place("modules", os.path.basename(MODULE)))
        os.mkdir(self.place("data", "calmframe"))
        os.symlink(METADATA, self.place("data", "calmframe", os.path.basename(METADATA)))
        self.clip = self.draw("clip.mkv", FRAMES)

    def place(self, *names):
        return os.path.join(self.folder, *names)

    def draw(self, name, frames, first=0):
        """Of 4:2:2, which MLT takes as it is."""
        path = self.place(name)
        subprocess.run(
            ["ffmpeg", "-v", "error", "-y", "-f", "rawvideo", "-pix_fmt", "rgb24", "-s", f"{WIDTH}x{HEIGHT}",
             "-r", str(RATE), "-i", "-", "-pix_fmt", "yuv422p", "-c:v", "ffv1", path],
            input=b"".join(wall(first + n).tobytes() for n in range(frames)), check=True)
        return path

    def melt(self, *arguments, timeout=120, cwd=None, **options):
        done = subprocess.run(["melt", *arguments], cwd=cwd or self.folder, env=self.env, text=True, timeout=timeout,
                              stdout=subprocess.PIPE, stderr=subprocess.STDOUT, **options)
        self.assertGreaterEqual(done.returncode, 0, done.stdout)
        return done.stdout

    def analyse(self, clip, out="pass.mlt", *more, **options):
        said = self.melt(clip, *more, "-attach", "calmframe", "analyze=1", "filename=clip.calm",
                         "-consumer", "xml:" + self.place(out), "all=1", "real_time=-1", **options)
        return said, self.place(out)

    def render(self, what, *consumer, threads=1, cwd=None):
        """What melt says, and the frames. Its encoder's consumer by itself, without a filter, writes nothing of a timewarp in 3 runs
        of 60 and waits for ever in one; the more the busier the machine. What hangs four times is no such run."""
        out = self.place("out.mkv")
        for _ in range(4):
            if os.path.exists(out):
                os.remove(out)
            try:
                said = self.melt(*([what] if isinstance(what, str) else what), "-consumer", "avformat:" + out,
                                 "vcodec=ffv1", "pix_fmt=yuv422p", "an=1", f"real_time=-{threads}", *consumer, timeout=40, cwd=cwd)
            except subprocess.TimeoutExpired:
                continue
            if os.path.exists(out) and os.path.getsize(out):
                return said, self.frames(out)
        self.fail("melt wrote nothing four times")

    def frames(self, path, pixels="yuv422p"):
        raw = subprocess.check_output(["ffmpeg", "-v", "error", "-i", path, "-vsync", "0", "-f", "rawvideo",
                                       "-pix_fmt", pixels, "-"])
        size = WIDTH * HEIGHT * 2
        return [hashlib.md5(raw[i:i + size]).hexdigest() for i in range(0, len(raw), size)]

    def program(self, clip, *flags):
        out = self.place("program.mkv")
        subprocess.run([PROGRAM, "stabilize", clip, out, "--codec", "ffv1", "--shots", "one", "--quiet",
                        "--overwrite", *flags], check=True)
        return self.frames(out)

    def property_of(self, document, name):
        with open(document, encoding="utf-8") as file:
            found = re.search(f'<property name="{name}">([^<]*)<', file.read())
        return found[1] if found else ""

    def set_properties(self, document, **values):
        with open(document, encoding="utf-8") as file:
            text = file.read()
        for name, value in values.items():
            text = re.sub(f' *<property name="{name}">[^<]*</property>\n', "", text)
            text = text.replace('<property name="mlt_service">calmframe</property>',
                                '<property name="mlt_service">calmframe</property>'
                                f'<property name="{name}">{value}</property>\n')
        changed = self.place("changed.mlt")
        with open(changed, "w", encoding="utf-8") as file:
            file.write(text)
        return changed

    def test_its_frames_are_the_programs(self):
        said, document = self.analyse(self.clip)
        self.assertEqual(self.property_of(document, "results"), "clip.calm", said)
        self.assertEqual(self.property_of(document, "analyze"), "0")
        steady = self.program(self.clip)
        self.assertNotEqual(steady, self.frames(self.clip))
        self.assertEqual(self.render(document)[1], steady)
        self.assertEqual(self.render(document, threads=4)[1], steady)
        # Other controls on the same results; one at its default is one that nobody set.
        for values, flags in (({"smoothness": 20, "method": "position"}, ("--smoothness", "20", "--method", "position")),
                              ({"framing": "stabilize-only"}, ("--framing", "stabilize-only")),
                              ({"smoothness": 50}, ())):
            with self.subTest(values):
                self.assertEqual(self.render(self.set_properties(document, **values))[1],
                                 self.program(self.clip, *flags))

    def test_frame_threads_analyse_in_order(self):
        # A consumer that needs every picture: MLT's xml doesn't wait for the last one of several threads.
        # On a busy machine it happens that a frame comes to no filter for 20 s while every other thread waits for it; that is told.
        for _ in range(3):
            said, frames = self.render([self.clip, "-attach", "calmframe", "analyze=1", "filename=clip.calm"], threads=4)
            if "was left out; analyse with real_time=-1" not in said:
                break
        self.assertEqual(frames, self.frames(self.clip), "as filmed")
        self.assertTrue(os.path.exists(self.place("clip.calm")), said)
        self.assertEqual(self.render([self.clip, "-attach", "calmframe", "results=clip.calm"])[1],
                         self.program(self.clip))

    def test_a_trim_shows_the_same_frames(self):
        _, document = self.analyse(self.clip)
        whole = self.render(document)[1]
        with open(document, encoding="utf-8") as file:
            text = file.read()
        trimmed = self.place("trimmed.mlt")
        with open(trimmed, "w", encoding="utf-8") as file:
            file.write(re.sub('<entry producer="producer0" in="[^"]*" out="[^"]*"/>',
                              '<entry producer="producer0" in="00:00:00.400" out="00:00:00.760"/>', text)
                       .replace(' in="0" out="29"', ""))
        self.assertEqual(self.render(trimmed)[1], whole[10:20])

    def test_an_analysis_of_a_part_stands_where_it_is(self):
        said, document = self.analyse(self.clip, "part.mlt", "in=5", "out=24")
        self.assertEqual(self.property_of(document, "results"), "clip.calm@5", said)
        part = self.place("part.mkv")
        subprocess.run(["ffmpeg", "-v", "error", "-i", self.clip, "-vf", "select=between(n\\,5\\,24),setpts=N/25/TB",
                        "-frames:v", "20", "-c:v", "ffv1", part], check=True)
        self.assertEqual(self.render(document)[1], self.program(part))

    def test_smaller_pictures_show_the_same(self):
        _, document = self.analyse(self.clip)
        self.render(document, "scale=0.5")
        self.program(self.clip)
        said = subprocess.run(["ffmpeg", "-v", "info", "-i", self.place("out.mkv"), "-i", self.place("program.mkv"), "-lavfi",
                               "[1:v]scale=96:72[b];[0:v]scale=96:72[a];[a][b]ssim", "-f", "null", "-"],
                              check=True, text=True, stderr=subprocess.PIPE).stderr
        self.assertGreater(float(re.search(r"All:([\d.]+)", said)[1]), 0.98)

    def expect_as_filmed(self, document, error, *melt):
        said, frames = self.render([document, *melt])
        self.assertRegex(said, error)
        self.assertEqual(len(re.findall(error, said)), 1, "told once")
        return frames

    def test_results_that_are_none_leave_the_picture(self):
        _, document = self.analyse(self.clip)
        filmed = self.frames(self.clip)
        results = self.place("clip.calm")
        with open(results, "rb") as file:
            good = file.read()
        for name, content, error in (("missing", None, "clip.calm"), ("foreign", b"not of ours" * 99, "clip.calm"),
                                     ("cut", good[:len(good) // 2], "clip.calm")):
            with self.subTest(name):
                os.remove(results)
                if content is not None:
                    with open(results, "wb") as file:
                        file.write(content)
                self.assertEqual(self.expect_as_filmed(document, error), filmed)
                if content is None:
                    open(results, "wb").close()
        with open(results, "wb") as file:
            file.write(good)
        self.assertNotEqual(self.render(document)[1], filmed, "whole again")

    def test_results_of_another_clip_are_refused(self):
        _, document = self.analyse(self.clip)
        self.draw("clip.mkv", FRAMES, first=50)  # another one under the name
        self.assertEqual(self.expect_as_filmed(document, "another clip"), self.frames(self.clip))

    def test_another_speed_is_another_clip(self):
        warped = self.draw("warped.mkv", FRAMES)
        twice = ["timewarp:2:" + warped, "-attach", "calmframe"]
        self.render([*twice, "analyze=1", "filename=clip.calm"])
        self.render(twice[0])
        fast = self.place("fast.mkv")
        os.rename(self.place("out.mkv"), fast)
        self.assertEqual(self.render([*twice, "results=clip.calm"])[1], self.program(fast))
        self.assertIn("another clip", self.render(["timewarp:3:" + warped, "-attach", "calmframe", "results=clip.calm"])[0])

    def test_another_rate_and_shape_are_refused(self):
        _, document = self.analyse(self.clip)
        with open(document, encoding="utf-8") as file:
            text = file.read()
        for change, error in (((r'frame_rate_num="\d+"', 'frame_rate_num="30"'), "25 frames a second, not 30"),
                              ((r'display_aspect_num="\d+"', 'display_aspect_num="16"'), "another shape")):
            with self.subTest(error):
                changed = self.place("changed.mlt")
                with open(changed, "w", encoding="utf-8") as file:
                    file.write(re.sub(*change, text))
                self.assertIn(error, self.render(changed)[0])

    def test_a_profile_of_another_rate_than_the_clips(self):
        said, document = self.analyse(self.clip, "pass.mlt", "-profile", "square_ntsc")
        self.assertTrue(os.path.exists(self.place("clip.calm")), said)
        steady = self.render([document])[0]
        self.assertNotIn("calm]", steady)

    def test_values_that_can_not_be_are_told(self):
        _, document = self.analyse(self.clip)
        changed = self.set_properties(document, method="sideways")
        self.assertEqual(self.expect_as_filmed(changed, "method is 'sideways'"), self.frames(self.clip))

    def test_what_can_not_be_analysed_leaves_nothing(self):
        filmed = self.draw("one.mkv", 1)
        said, document = self.analyse(filmed)
        self.assertEqual(self.property_of(document, "results"), "", said)
        self.assertNotEqual(self.property_of(document, "error"), "")
        self.assertFalse(os.path.exists(self.place("clip.calm")))

    def test_no_place_for_the_results(self):
        said, document = self.analyse(self.clip, "pass.mlt", preexec_fn=lambda: (
            signal.signal(signal.SIGXFSZ, signal.SIG_IGN), resource.setrlimit(resource.RLIMIT_FSIZE, (20000, 20000))))
        self.assertEqual([name for name in os.listdir(self.folder) if "calm" in name and name != "calmframe"], [], said)
        said = self.melt(self.clip, "-attach", "calmframe", "analyze=1", "filename=/nowhere/clip.calm",
                         "-consumer", "xml:" + self.place("none.mlt"), "all=1", "real_time=-1")
        self.assertIn("/nowhere/clip.calm", said)
        self.assertEqual(self.property_of(self.place("none.mlt"), "results"), "")

    def test_an_analysis_that_is_ended_leaves_nothing(self):
        _, document = self.analyse(self.clip)
        os.remove(self.place("clip.calm"))
        again = self.set_properties(document, analyze=1, results="")
        said = self.melt(again, "out=19", "-consumer", "xml:" + self.place("part.mlt"), "all=1", "real_time=-1")
        self.assertFalse(os.path.exists(self.place("clip.calm")), said)
        self.assertEqual(self.property_of(self.place("part.mlt"), "results"), "")

    # What an editor writes: the clip, the filter with the panel's values, and who takes the frames.
    DOCUMENT = """<?xml version="1.0"?>
<mlt LC_NUMERIC="C" root="{root}">
 <profile width="192" height="144" frame_rate_num="25" frame_rate_den="1" progressive="1" colorspace="601"
  sample_aspect_num="1" sample_aspect_den="1" display_aspect_num="4" display_aspect_den="3"/>
 {consumer}
 <{kind} id="clip" out="{last}"><property name="length">30</property><property name="resource">clip.mkv</property>
  <property name="mlt_service">{service}</property>{inside}</{kind}>
 <playlist id="main"><entry producer="clip" in="{first}" out="{last}">{on_cut}</entry></playlist>
</mlt>"""

    def test_jobs_of_editors(self):
        """Each editor's analysis, of which the property results alone goes into the project."""
        panel = "".join(f'<property name="{name}">{value}</property>' for name, value in (
            ("mlt_service", "calmframe"), ("smoothness", "20"), ("method", "position"), ("window", "auto")))
        steady = self.program(self.clip, "--smoothness", "20", "--method", "position")
        self.env["XDG_DATA_HOME"] = self.place("user")
        for kind, service, threads, on_cut in (("producer", "avformat", ' real_time="-1"', True),
                                               ("chain", "avformat-novalidate", "", False)):
            with self.subTest(kind):
                document = self.place("changed.mlt")
                filter_ = f'<filter out="{FRAMES - 1}">{panel}<property name="analyze">1</property></filter>'
                values = dict(root=self.folder, kind=kind, service=service, first=0, last=FRAMES - 1)
                job = self.DOCUMENT.format(**values, inside=filter_, on_cut="", consumer=(
                    f'<consumer mlt_service="xml" all="1" audio_off="1" no_meta="1"{threads} '
                    f'resource="{self.place("done.mlt")}"/>'))
                with open(document, "w", encoding="utf-8") as file:
                    file.write(job[:job.index(" <playlist")] + "</mlt>")
                said = self.melt("-abort", "xml:" + document)
                results = self.property_of(self.place("done.mlt"), "results")
                self.assertTrue(os.path.exists(self.place("user", "calmframe", results)), said)
                filter_ = f'<filter>{panel}<property name="results">{results}</property></filter>'
                with open(document, "w", encoding="utf-8") as file:
                    file.write(self.DOCUMENT.format(**values, consumer="", inside="" if on_cut else filter_,
                                                    on_cut=filter_ if on_cut else ""))
                self.assertEqual(self.render(document)[1], steady)
                shutil.rmtree(self.place("user"))

    def test_documents_are_of_any_folder(self):
        _, document = self.analyse(self.clip)
        self.assertEqual(self.property_of(document, "results"), "clip.calm", "relative to the document's root")
        os.mkdir(self.place("elsewhere"))
        self.assertEqual(self.render(document, cwd=self.place("elsewhere"))[1], self.program(self.clip))

    def test_twice_on_one_clip(self):
        self.analyse(self.clip)
        once = ["-attach", "calmframe", "results=clip.calm"]
        said, frames = self.render([self.clip, *once, *once])
        self.assertNotIn("Error", said)
        self.assertEqual(len(frames), FRAMES)
        self.assertEqual(self.render([self.clip, *once])[1], self.program(self.clip))

    def test_the_metadata_tells_every_parameter(self):
        said = self.melt("-query", "filter=calmframe")
        for name in ("analyze", "results", "error", "smoothness", "zoom_at_most", "detailed_analysis"):
            self.assertIn("identifier: " + name, said)


if __name__ == "__main__":
    PROGRAM, MODULE, METADATA = (os.path.abspath(path) for path in sys.argv[1:4])
    unittest.main(argv=sys.argv[:1] + sys.argv[4:])
