#include "VexHelpMenu.h"

#include "VexIntegration.h"

#include <QAction>
#include <QApplication>
#include <QMessageBox>

VexHelpMenu::VexHelpMenu(QWidget *parent)
    : QMenu(tr("Help"), parent)
{
    setObjectName(QStringLiteral("helpMenu"));
    m_aboutAction = addAction(tr("About %1").arg(QApplication::applicationDisplayName()));
    m_aboutAction->setObjectName(QStringLiteral("aboutAction"));
    m_aboutAction->setMenuRole(QAction::AboutRole);
    m_aboutQtAction = addAction(tr("About Qt"));
    m_aboutQtAction->setObjectName(QStringLiteral("aboutQtAction"));
    m_aboutQtAction->setMenuRole(QAction::AboutQtRole);
    connect(m_aboutAction, &QAction::triggered, this, &VexHelpMenu::showAbout);
    connect(m_aboutQtAction, &QAction::triggered, qApp, &QApplication::aboutQt);
}

QAction *VexHelpMenu::aboutAction() const
{
    return m_aboutAction;
}

QAction *VexHelpMenu::aboutQtAction() const
{
    return m_aboutQtAction;
}

QString VexHelpMenu::aboutText() const
{
    return tr("<h3>%1 %2</h3><p>%3</p><p>Built with Qt %4, running on Qt %5.</p>")
        .arg(QApplication::applicationDisplayName().toHtmlEscaped(), vexVersion().toHtmlEscaped(),
             vexDescription().toHtmlEscaped(), QStringLiteral(QT_VERSION_STR), QString::fromLatin1(qVersion()));
}

void VexHelpMenu::showAbout()
{
    QWidget *owner = parentWidget() ? parentWidget()->window() : nullptr;
    QMessageBox::about(owner, tr("About %1").arg(QApplication::applicationDisplayName()), aboutText());
}
