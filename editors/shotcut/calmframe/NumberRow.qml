import QtQuick 2.12
import QtQuick.Controls 2.12
import QtQuick.Layouts 1.12
import Shotcut.Controls 1.0 as Shotcut

// A property of the filter that is a number.
RowLayout {
    property string property
    property string label
    property string tip
    property real minimum
    property real maximum
    property real initial
    property alias decimals: slider.decimals
    property alias suffix: slider.suffix

    function load() {
        slider.value = filter.getDouble(property);
    }

    Layout.fillWidth: true

    Label {
        text: label
        horizontalAlignment: Text.AlignRight
        Layout.preferredWidth: 150

        Shotcut.HoverTip {
            text: tip
        }

    }

    Shotcut.SliderSpinner {
        id: slider

        minimumValue: minimum
        maximumValue: maximum
        onValueChanged: {
            if (filter.getDouble(property) !== value)
                filter.set(property, value);
        }
    }

    Shotcut.UndoButton {
        onClicked: slider.value = initial
    }

}
