"""The panels of editors have the controls that the filter has, with its ranges and values.

panels_test.py EDITORS-FOLDER
"""
import pathlib
import re
import sys
import unittest
import xml.etree.ElementTree

FOLDER = pathlib.Path()
NOT_IN_PANELS = {"analyze", "filename", "error", "results"}


def filter_controls():
    """Name: range and default, or values, of each, from the metadata."""
    controls = {}
    for block in (FOLDER / "mlt/filter_calmframe.yml").read_text().split("- identifier: ")[1:]:
        name = block.split("\n", 1)[0]
        numbers = [re.search(rf"{key}: (\S+)", block) for key in ("minimum", "maximum", "default")]
        values = re.findall(r"^      - (\S+)$", block, re.MULTILINE)
        kind = re.search(r"type: (\w+)", block)[1]
        if name not in NOT_IN_PANELS:
            controls[name] = {"float": lambda: tuple(float(n[1]) for n in numbers), "boolean": lambda: bool,
                              "string": lambda: tuple(values)}[kind]()
    return controls


class PanelsTest(unittest.TestCase):
    def test_kdenlive(self):
        controls = {}
        for row in xml.etree.ElementTree.parse(FOLDER / "kdenlive/calmframe.xml").getroot().iter("parameter"):
            kind, name = row.get("type"), row.get("name")
            if kind == "constant":
                controls[name] = tuple(float(row.get(key)) for key in ("min", "max", "default"))
            elif kind == "list":
                controls[name] = tuple(row.get("paramlist").split(";"))
                self.assertEqual(row.get("default"), controls[name][0])
                self.assertEqual(len(row.find("paramlistdisplay").text.split(",")), len(controls[name]), name)
            elif kind == "bool":
                controls[name] = bool
        self.assertEqual(controls, filter_controls())

    def test_shotcut(self):
        controls = {}
        text = (FOLDER / "shotcut/calmframe/ui.qml").read_text()
        for kind, row in re.findall(r"^        (\w+)Row {\n(.*?)^        }$", text, re.MULTILINE | re.DOTALL):
            said = dict(re.findall(r"^            (\w+): (.*)$", row, re.MULTILINE))
            name = said["property"].strip("'")
            if kind == "Number":
                controls[name] = tuple(float(said[key]) for key in ("minimum", "maximum", "initial"))
            elif kind == "Choice":
                controls[name] = tuple(re.findall(r"'([^']+)'", said["values"]))
                self.assertEqual(said["texts"].count("qsTr"), len(controls[name]), name)
            else:
                controls[name] = bool
            self.assertIn(said["id"], re.search(r"property var rows: \[(.*)\]", text)[1].split(", "))
        self.assertEqual(controls, filter_controls())


if __name__ == "__main__":
    FOLDER = pathlib.Path(sys.argv[1])
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
