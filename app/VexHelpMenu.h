#pragma once

#include <QMenu>

class QAction;

// The "Help" menu of a main window: "About" names the program, its version
// and description as given to vexInit, and the Qt version; "About Qt" is
// Qt's own box.
class VexHelpMenu : public QMenu
{
    Q_OBJECT

public:
    explicit VexHelpMenu(QWidget *parent = nullptr);

    QAction *aboutAction() const;
    QAction *aboutQtAction() const;
    // Rich text of the About box.
    QString aboutText() const;

public slots:
    void showAbout();

private:
    QAction *m_aboutAction = nullptr;
    QAction *m_aboutQtAction = nullptr;
};
