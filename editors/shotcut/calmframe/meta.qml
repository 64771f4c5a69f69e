import QtQuick 2.0
import org.shotcut.qml 1.0

Metadata {
    type: Metadata.Filter
    name: qsTr("Calmframe")
    keywords: qsTr('stabilize steady smooth shake', 'search keywords for the Calmframe video filter') + ' calmframe'
    mlt_service: "calmframe"
    qml: "ui.qml"
    isClipOnly: true
    allowMultiple: false
    isGpuCompatible: false

    keyframes {
        allowTrim: false
    }

}
