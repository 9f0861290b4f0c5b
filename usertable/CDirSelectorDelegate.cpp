#include "CDirSelectorDelegate.h"

#include "MyEditor.h"
#include "UserIndex.h"
#include "policy/FtpServerConfig.h"

#include <QApplication>
#include <QDir>
#include <QFileDialog>
#include <QFileInfo>
#include <QMessageBox>
#include <QPushButton>

CDirSelectorDelegate::CDirSelectorDelegate(QWidget *mainWindow, FtpServerConfig *config, QObject *parent)
    : QStyledItemDelegate(parent)
    , m_mainWindow(mainWindow)
    , m_config(config)
{
}

QWidget *CDirSelectorDelegate::createEditor(QWidget *parent, const QStyleOptionViewItem &, const QModelIndex &) const
{
    auto *editor = new MyEditor(parent);
    auto *self = const_cast<CDirSelectorDelegate *>(this);
    connect(editor, &MyEditor::fileSelectorRequested, self, [self, editor] { self->selectDirectory(editor); });
    return editor;
}

void CDirSelectorDelegate::selectDirectory(QWidget *editor)
{
    auto *pathEditor = static_cast<MyEditor *>(editor);
    const RootDirectory &root = m_config->root();
    const QString chosen = QFileDialog::getExistingDirectory(dialogParent(), tr("Select new FTP root directory"),
                                                             root.resolve(pathEditor->text()));
    if (chosen.isEmpty())
        return;
    // The chooser walks the disk; the cell holds the path as the
    // administrator knows it.
    QString shown = QDir::cleanPath(chosen);
    if (!root.isSystemRoot()) {
        if (shown == root.path())
            shown = QStringLiteral("/");
        else if (shown.startsWith(root.path() + QLatin1Char('/')))
            shown = shown.mid(root.path().size());
    }
    m_text = shown;
    pathEditor->setText(m_text);
    emit commitData(editor);
}

void CDirSelectorDelegate::setEditorData(QWidget *editor, const QModelIndex &index) const
{
    static_cast<MyEditor *>(editor)->setText(index.data(Qt::EditRole).toString());
}

void CDirSelectorDelegate::setModelData(QWidget *editor, QAbstractItemModel *model, const QModelIndex &index) const
{
    const QString directory = static_cast<MyEditor *>(editor)->text();
    // A relative or empty path goes to the model as it is: the model
    // refuses it with its own reason.
    if (directory.startsWith(QLatin1Char('/')) && !QFileInfo(m_config->root().resolve(directory)).isDir()) {
        QMessageBox box(QMessageBox::Question, QString(), tr("Directory %1 does not exist.").arg(directory),
                        QMessageBox::No, dialogParent());
        box.setInformativeText(tr("Do you want to create it?"));
        const QPushButton *create = box.addButton(tr("Create"), QMessageBox::ActionRole);
        box.setEscapeButton(QMessageBox::No);
        box.exec();
        if (box.clickedButton() != create)
            return;
        AccessFailure failure;
        if (!m_config->createRootDirectory(UserIndex(index).name(), directory.toLocal8Bit(), &failure)) {
            showFailureDialog(m_config->interaction(), failure);
            return;
        }
    }
    model->setData(index, directory, Qt::EditRole);
}

void CDirSelectorDelegate::updateEditorGeometry(QWidget *editor, const QStyleOptionViewItem &option,
                                                const QModelIndex &) const
{
    editor->setGeometry(option.rect);
}

QWidget *CDirSelectorDelegate::dialogParent() const
{
    if (QWidget *active = QApplication::activeWindow())
        return active;
    return m_mainWindow;
}
