import QtQuick 2.12
import QtQuick.Controls 2.12
import QtQuick.Layouts 1.12
import Shotcut.Controls 1.0 as Shotcut

Item {
    id: root

    property var rows: [smoothness, result, method, framing, maximumScale, cropLessSmoothMore, window, zoomAtMost, zoomSpeed, steady, asSet, additionalScale, actionSafeMargin, rollingShutterRipple, detailedAnalysis]

    function load() {
        rows.forEach(function (row) {
            row.load();
        });
    }

    function setAll(values) {
        rows.forEach(function (row) {
            filter.set(row.property, row.property in values ? values[row.property] : row.initial);
        });
    }

    function savePreset(name, values) {
        setAll(values);
        filter.savePreset(preset.parameters, name);
    }

    function showStatus() {
        var results = filter.get('results');
        var error = filter.get('error');
        if (error.length > 0)
            status.text = error;
        else if (results.length > 0)
            status.text = qsTr('Steadied from %1').arg(results);
        else
            status.text = qsTr('Click Analyze to use this filter.');
    }

    width: 400
    height: column.implicitHeight + 16
    Component.onCompleted: {
        filter.set('analyze', 0);
        if (filter.isNew) {
            savePreset(qsTr('Calmer'), {
                "smoothness": 100
            });
            savePreset(qsTr('Keeps More of the Picture'), {
                "smoothness": 15
            });
            savePreset(qsTr('Tripod'), {
                "result": 'no-motion'
            });
            savePreset(qsTr('Bends Nothing'), {
                "method": 'position-scale-rotation'
            });
            setAll({
            });
            filter.savePreset(preset.parameters);
        }
        load();
        showStatus();
    }

    Connections {
        function onAnalyzeFinished() {
            analyze.enabled = true;
            showStatus();
        }

        target: filter
    }

    ColumnLayout {
        id: column

        anchors.fill: parent
        anchors.margins: 8

        RowLayout {
            Label {
                text: qsTr('Preset')
                horizontalAlignment: Text.AlignRight
                Layout.preferredWidth: 150
            }

            Shotcut.Preset {
                id: preset

                parameters: rows.map(function (row) {
                    return row.property;
                })
                onPresetSelected: load()
            }

        }

        RowLayout {
            Item {
                Layout.preferredWidth: 150
            }

            Shotcut.Button {
                id: analyze

                text: qsTr('Analyze')
                onClicked: {
                    enabled = false;
                    status.text = qsTr('Analyzing...');
                    filter.set('error', '');
                    filter.getHash();
                    filter.analyze();
                }
            }

        }

        Label {
            id: status

            wrapMode: Text.WrapAnywhere
            Layout.fillWidth: true
        }

        Label {
            text: qsTr('<b>Motion</b>')
        }

        NumberRow {
            id: smoothness

            property: 'smoothness'
            label: qsTr('Smoothness')
            tip: qsTr('How calm the camera gets. More crops more of the edge.')
            minimum: 0
            maximum: 1000
            initial: 50
            decimals: 1
            suffix: ' %'
        }

        ChoiceRow {
            id: result

            property: 'result'
            label: qsTr('Result')
            tip: qsTr('Keeps the moves of the camera and calms them, or holds the picture still.')
            values: ['smooth-motion', 'no-motion']
            texts: [qsTr('Smooth Motion'), qsTr('No Motion')]
        }

        ChoiceRow {
            id: method

            property: 'method'
            label: qsTr('Method')
            tip: qsTr('Each part of a frame is bent on its own, or the frame is tilted, turned and resized, or only shifted.')
            values: ['subspace-warp', 'perspective', 'position-scale-rotation', 'position']
            texts: [qsTr('Subspace Warp'), qsTr('Perspective'), qsTr('Position, Scale, Rotation'), qsTr('Position')]
        }

        ChoiceRow {
            id: steady

            property: 'steady'
            label: qsTr('Steady')
            tip: qsTr('What stands still where somebody near moves against what is behind.')
            values: ['auto', 'background', 'subject']
            texts: [qsTr('Automatic'), qsTr('Background'), qsTr('Subject')]
        }

        Label {
            text: qsTr('<b>Borders</b>')
        }

        ChoiceRow {
            id: framing

            property: 'framing'
            label: qsTr('Framing')
            tip: qsTr('Edges that the motion lays bare are cut off and the rest enlarged, only cut off, or shown as they are.')
            values: ['crop-auto-scale', 'crop', 'stabilize-only']
            texts: [qsTr('Crop and Enlarge'), qsTr('Crop'), qsTr('Show Edges')]
        }

        NumberRow {
            id: maximumScale

            property: 'maximum_scale'
            label: qsTr('Maximum Scale')
            tip: qsTr('No frame is enlarged further; what that leaves empty is black.')
            minimum: 100
            maximum: 10000
            initial: 150
            decimals: 1
            suffix: ' %'
        }

        NumberRow {
            id: cropLessSmoothMore

            property: 'crop_less_smooth_more'
            label: qsTr('Crop Less, Smooth More')
            tip: qsTr('Below 50 the window gives way to sudden moves, above it stands stiller, at 100 it does not move.')
            minimum: 0
            maximum: 100
            initial: 50
            decimals: 1
            suffix: ' %'
        }

        NumberRow {
            id: additionalScale

            property: 'additional_scale'
            label: qsTr('Additional Scale')
            tip: qsTr('The steady picture larger or smaller, on top of all.')
            minimum: 0
            maximum: 10000
            initial: 100
            decimals: 1
            suffix: ' %'
        }

        NumberRow {
            id: actionSafeMargin

            property: 'action_safe_margin'
            label: qsTr('Action-safe Margin')
            tip: qsTr('A border that need not be filled.')
            minimum: 0
            maximum: 100
            initial: 0
            decimals: 1
            suffix: ' %'
        }

        Label {
            text: qsTr('<b>Window</b>')
        }

        ChoiceRow {
            id: window

            property: 'window'
            label: qsTr('Window')
            tip: qsTr('A part of each frame that follows the picture, or one crop window for the whole clip.')
            values: ['auto', 'follow', 'steady']
            texts: [qsTr('Automatic'), qsTr('Follows the Picture'), qsTr('One for the Clip')]
        }

        NumberRow {
            id: zoomAtMost

            property: 'zoom_at_most'
            label: qsTr('Zoom at Most')
            tip: qsTr('How many times a window that follows enlarges, from 1 on; 0 is as Maximum Scale has it.')
            minimum: 0
            maximum: 100
            initial: 0
            decimals: 2
            suffix: ' x'
        }

        NumberRow {
            id: zoomSpeed

            property: 'zoom_speed'
            label: qsTr('Zoom Speed')
            tip: qsTr('How fast a window that follows changes its zoom.')
            minimum: 0
            maximum: 1000
            initial: 5
            decimals: 1
            suffix: ' %/s'
        }

        Label {
            text: qsTr('<b>Advanced</b>')
        }

        SwitchRow {
            id: asSet

            property: 'as_set'
            label: qsTr('As Set')
            tip: qsTr('Nothing is chosen for the clip; the controls count as they are.')
        }

        ChoiceRow {
            id: rollingShutterRipple

            property: 'rolling_shutter_ripple'
            label: qsTr('Rolling Shutter Ripple')
            tip: qsTr('Harder against the jelly of quick shakes.')
            values: ['automatic', 'enhanced']
            texts: [qsTr('Automatic Reduction'), qsTr('Enhanced Reduction')]
        }

        SwitchRow {
            id: detailedAnalysis

            property: 'detailed_analysis'
            label: qsTr('Detailed Analysis')
            tip: qsTr('Four times the features, for clips whose motion comes out wrong. Takes a new analysis.')
        }

        Item {
            Layout.fillHeight: true
        }

    }

}
