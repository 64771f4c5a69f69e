"""The Python module: what it refuses, what it raises, and that frames are the library's."""
import threading
import unittest

import calmframe
import numpy as np

WIDTH, HEIGHT, FRAMES = 160, 120, 20


def shaky(number, components=3):
    """A patterned wall before a camera that trembles."""
    y, x = np.mgrid[0:HEIGHT, 0:WIDTH].astype(np.float64)
    x += 6 * np.sin(2.1 * number)
    y += 5 * np.sin(1.7 * number + 1)
    waves = [np.sin(x / a) * np.cos(y / b) for a, b in ((3.1, 4.3), (7.7, 5.9), (13.0, 17.0))]
    grey = (127 + 40 * sum(waves)).astype(np.uint8)
    return np.repeat(grey[:, :, None], components, 2)


FRAMES_OF = [shaky(n) for n in range(FRAMES)]


class SessionTest(unittest.TestCase):
    def test_pushed_and_fetched_frames_come_out_alike(self):
        with calmframe.Session(WIDTH, HEIGHT, 50, format="rgb") as session:
            self.assertEqual(session.state, "idle")
            for number, frame in enumerate(FRAMES_OF):
                session.push(number, frame)
            session.finish()
            self.assertTrue(session.wait(60))
            pushed = [session.render(n, frame) for n, frame in enumerate(FRAMES_OF)]
            saved = session.save()
        asked = []

        def fetch(number):
            asked.append(number)
            return FRAMES_OF[number][::-1][::-1]  # rows and columns as they come

        with calmframe.Session(WIDTH, HEIGHT, FRAMES, format="rgb", fetch=fetch, rate="25/1") as session:
            session.solve()
            self.assertEqual(asked, list(range(FRAMES)))
            fetched = [None] * FRAMES
            out = np.zeros((HEIGHT, 2 * WIDTH, 3), np.uint8)[:, :WIDTH]  # rows apart

            def draw(first):
                for n in range(first, FRAMES, 2):
                    fetched[n] = session.render(n)

            threads = [threading.Thread(target=draw, args=(first,)) for first in (0, 1)]
            for thread in threads:
                thread.start()
            for thread in threads:
                thread.join()
            self.assertIs(session.render(3, out=out), out)
            outcome, path = session.outcome(), session.path()
            self.assertEqual(session.report()["shots"][0]["end_frame"], FRAMES)
            self.assertEqual(session.shots()[0]["decibels"], outcome["decibels"])
        for one, other in zip(pushed, fetched):
            np.testing.assert_array_equal(one, other)
        np.testing.assert_array_equal(out, pushed[3])
        self.assertLess(outcome["after"]["mean"], outcome["before"]["mean"] / 2)
        self.assertEqual(path.shape, (FRAMES,))
        self.assertAlmostEqual(path["zoom"].max(), outcome["most_zoom"], 9)
        moved = [np.abs(np.diff(path[which][1:, 2])).mean() for which in ("before", "after")]
        self.assertLess(moved[1], moved[0] / 2)
        with calmframe.Session(WIDTH, HEIGHT, 50, format="rgb") as session:
            session.load(saved)
            session.solve()
            np.testing.assert_array_equal(session.render(7, FRAMES_OF[7]), pushed[7])

    def test_what_is_no_frame(self):
        with calmframe.Session(WIDTH, HEIGHT, 5, format="yuv420p") as session:
            luma, chroma = np.zeros((HEIGHT, WIDTH), np.uint8), np.zeros((60, 80), np.uint8)
            session.push(0, (luma, chroma, chroma))
            for wrong in ((luma, chroma), (luma, chroma, luma),
                          (luma.astype(np.uint16), chroma, chroma), (None, chroma, chroma)):
                with self.assertRaises(ValueError):
                    session.push(1, wrong)
        with self.assertRaises(ValueError):
            calmframe.Session(WIDTH, HEIGHT, 5, format="grey")

    def test_failures_have_a_code_and_those_of_the_caller_pass(self):
        def fetch(number):
            if number == 4:
                raise KeyError("no frame")
            return FRAMES_OF[number]

        with calmframe.Session(WIDTH, HEIGHT, FRAMES, format="rgb", fetch=fetch) as session:
            with self.assertRaisesRegex(calmframe.Error, "did you mean 'Smoothness'") as refused:
                session.set("Smothness", 30)
            self.assertEqual(refused.exception.code, "CALMFRAME_ERROR_ARGUMENT")
            session.set("Smoothness", 30)
            session.set("as-set", True)
            value = {c["name"]: c["value"] for c in session.controls()}
            self.assertEqual(value["Smoothness"], 30)
            session.start()
            with self.assertRaisesRegex(KeyError, "no frame"):
                session.wait()
            self.assertEqual(session.state, "failed")
        with self.assertRaises(calmframe.Error):
            session.start()


if __name__ == "__main__":
    unittest.main()
