import QtQuick 2.12
import QtQuick.Controls 2.12
import QtQuick.Layouts 1.12
import Shotcut.Controls 1.0 as Shotcut

// A property of the filter that is one of some words, the first of which is the default.
RowLayout {
    property string property
    property string label
    property string tip
    property var values
    property alias texts: combo.model
    property string initial: values[0]

    function load() {
        combo.currentIndex = Math.max(values.indexOf(filter.get(property)), 0);
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

    Shotcut.ComboBox {
        id: combo

        Layout.fillWidth: true
        onActivated: filter.set(property, values[index])
    }

    Shotcut.UndoButton {
        onClicked: {
            filter.set(property, initial);
            load();
        }
    }

}
