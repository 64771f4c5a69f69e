import QtQuick 2.12
import QtQuick.Controls 2.12
import QtQuick.Layouts 1.12
import Shotcut.Controls 1.0 as Shotcut

// A property of the filter that is on or off, off by default.
RowLayout {
    property string property
    property string label
    property string tip
    property int initial: 0

    function load() {
        box.checked = filter.get(property) === '1';
    }

    Layout.fillWidth: true

    Item {
        Layout.preferredWidth: 150
    }

    CheckBox {
        id: box

        text: label
        Layout.fillWidth: true
        onClicked: filter.set(property, checked ? 1 : 0)

        Shotcut.HoverTip {
            text: tip
        }

    }

    Shotcut.UndoButton {
        onClicked: {
            filter.set(property, initial);
            load();
        }
    }

}
