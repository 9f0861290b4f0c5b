#pragma once

#include <QString>

class QWidget;

// The desktop integration the window relies on: the program's identity, the
// help menu (VexHelpMenu.h), emblemed theme icons (VexIcon.h) and window
// geometry kept across runs.

// Records the program's version and one-line description and gives the
// application a fixed organisation and name, so that QSettings stores in
// the same place for every start.
void vexInit(const char *version, const char *description);
QString vexVersion();
QString vexDescription();

// The widget's geometry under the settings key "geometry/<key>"; an empty
// key stands for the widget's class name.
void vexSaveGeometry(const QWidget *widget, const QString &key = QString());
// False (and the widget untouched) when nothing usable is stored.
bool vexRestoreGeometry(QWidget *widget, const QString &key = QString());
