#include "CPermissionDelegate.h"

#include "UserIndex.h"
#include "common/AppStrings.h"
#include "dialogs/PermissionsEditorDialog.h"
#include "policy/FtpServerConfig.h"

#include <QApplication>
#include <QFile>
#include <QFileInfo>
#include <QMessageBox>

CPermissionDelegate::CPermissionDelegate(QObject *parent)
    : QStyledItemDelegate(parent)
{
}

QWidget *CPermissionDelegate::createEditor(QWidget *parent, const QStyleOptionViewItem &,
                                           const QModelIndex &index) const
{
    const UserIndex user(index);
    if (!user.model)
        return nullptr;
    FtpServerConfig &config = user.model->config();
    PermissionsEditorDialog dialog(index.data(Qt::EditRole).toString(), config, user.name(),
                                   parent ? parent->window() : nullptr);
    if (dialog.exec() != QDialog::Accepted)
        return nullptr;

    const AppStrings &strings = AppStrings::instance();
    const QStringList known{strings.fullAccess, strings.write, strings.download, strings.upload, strings.mkdir};
    QStringList rights;
    for (const QString &word : dialog.rightsString().split(QStringLiteral(", "), Qt::SkipEmptyParts)) {
        if (known.contains(word)) {
            rights << word;
        } else {
            QMessageBox::warning(QApplication::activeWindow(), QString(),
                                 tr("Invalid mode name (will be deleted): ") + word);
        }
    }
    // The index is of the view's model, which may be a proxy of the users
    // model; either takes the edit.
    const QByteArray directory = dialog.directory();
    const QFileDevice::Permissions bits = dialog.permissions();
    const_cast<QAbstractItemModel *>(index.model())->setData(index, rights.join(QStringLiteral(", ")), Qt::EditRole);

    if (directory.isEmpty())
        return nullptr;
    const QString onDisk = config.root().resolve(QString::fromLocal8Bit(directory));
    constexpr QFileDevice::Permissions classBits = QFileDevice::ReadOwner | QFileDevice::WriteOwner
        | QFileDevice::ExeOwner | QFileDevice::ReadGroup | QFileDevice::WriteGroup | QFileDevice::ExeGroup
        | QFileDevice::ReadOther | QFileDevice::WriteOther | QFileDevice::ExeOther;
    // Qt's user bits mirror the owner's when the process owns the file;
    // only the owner, group and other bits are compared.
    const QFileDevice::Permissions current = QFileInfo(onDisk).permissions() & classBits;
    if (current != bits && !QFile::setPermissions(onDisk, bits)) {
        QMessageBox::warning(QApplication::activeWindow(), QString(),
                             tr("Unable to chmod directory: ") + QString::fromLocal8Bit(directory));
    }
    return nullptr;
}

void CPermissionDelegate::updateEditorGeometry(QWidget *editor, const QStyleOptionViewItem &option,
                                               const QModelIndex &) const
{
    editor->setGeometry(option.rect);
}
