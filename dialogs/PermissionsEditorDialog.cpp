#include "PermissionsEditorDialog.h"

#include "ComboBoxes.h"
#include "common/AppStrings.h"
#include "policy/FtpServerConfig.h"
#include "ui_PermissionsEditorDialog.h"

#include <QApplication>
#include <QComboBox>
#include <QFileInfo>
#include <QMessageBox>
#include <QPushButton>

namespace {

const QString separator = QStringLiteral(", ");

} // namespace

PermissionsEditorDialog::PermissionsEditorDialog(const QString &rights, FtpServerConfig &config, const QByteArray &user,
                                                 QWidget *parent)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::PermissionsEditorDialog>())
    , m_config(config)
    , m_user(user)
{
    m_ui->setupUi(this);
    QPushButton *ok = m_ui->dialogButtonBox->button(QDialogButtonBox::Ok);
    ok->setEnabled(false);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::accepted, this, &QDialog::accept);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::rejected, this, &QDialog::reject);

    const AppStrings &strings = AppStrings::instance();
    const QStringList words = rights.split(separator);
    const bool full = words.contains(strings.fullAccess);
    m_ui->ftp_write->setChecked(full || words.contains(strings.write));
    m_ui->ftp_download->setChecked(full || words.contains(strings.download));
    m_ui->ftp_upload->setChecked(full || words.contains(strings.upload));
    m_ui->ftp_mkdir->setChecked(full || words.contains(strings.mkdir));

    // The server knows upload and mkdir only in anonymous and guest sessions.
    const bool uploads = m_config.isAnonymousUser(m_user) || m_config.value("guest_enable").toLower() == "yes";
    m_ui->ftp_upload->setEnabled(uploads);
    m_ui->ftp_mkdir->setEnabled(uploads);

    // A user who is not confined has "/" as its root, which is not the
    // user's own to open up.
    m_directory = m_config.effectiveRoot(m_user);
    if (m_directory.isEmpty() || m_directory == "/") {
        m_directory.clear();
        m_ui->fs_groupbox->setEnabled(false);
    } else {
        const QString onDisk = m_config.root().resolve(QString::fromLocal8Bit(m_directory));
        if (!QFileInfo(onDisk).isDir())
            offerToCreate(onDisk);
        if (!QFileInfo(onDisk).isDir()) {
            // No bits to show, and none to set.
            m_directory.clear();
            m_ui->fs_groupbox->setEnabled(false);
        }
        fillOwners(onDisk);
        const QFileDevice::Permissions current = QFileInfo(onDisk).permissions();
        for (const PermissionBox &entry : permissionBoxes())
            entry.box->setChecked(current.testFlag(entry.flag));
    }

    for (QCheckBox *box : findChildren<QCheckBox *>())
        connect(box, &QCheckBox::toggled, this, &PermissionsEditorDialog::enableDialogOkButton);
    for (QComboBox *combo : {m_ui->owner_combo, m_ui->group_combo})
        connect(combo, QOverload<int>::of(&QComboBox::currentIndexChanged), this,
                &PermissionsEditorDialog::enableDialogOkButton);
}

PermissionsEditorDialog::~PermissionsEditorDialog() = default;

void PermissionsEditorDialog::offerToCreate(const QString &onDisk)
{
    const QString shown = QString::fromLocal8Bit(m_directory);
    QWidget *parent = QApplication::activeWindow() ? QApplication::activeWindow() : parentWidget();
    QMessageBox box(QMessageBox::Question, QString(), tr("Directory %1 does not exist.").arg(shown), QMessageBox::No,
                    parent);
    box.setInformativeText(tr("(Do you want to create it?"));
    const QPushButton *create = box.addButton(tr("Create"), QMessageBox::ActionRole);
    box.exec();
    if (box.clickedButton() != create)
        return;
    // Through the engine, so that the new root belongs to the account the
    // user's sessions run as.
    if (!m_config.createRootDirectory(m_user, m_directory) || !QFileInfo(onDisk).isDir())
        QMessageBox::warning(parent, QString(), tr("Unable to create directory: ") + shown);
}

void PermissionsEditorDialog::fillOwners(const QString &onDisk)
{
    const AccountStore &accounts = m_config.accounts();
    // In one go: a directory server may list a hundred thousand accounts.
    QStringList names;
    names.reserve(static_cast<int>(accounts.accounts().size()));
    for (const auto &account : accounts.accounts())
        names << QString::fromLocal8Bit(account.first);
    m_ui->owner_combo->addItems(names);
    names.clear();
    for (const auto &group : accounts.groups())
        names << QString::fromLocal8Bit(group.second.name);
    m_ui->group_combo->addItems(names);
    const QFileInfo info(onDisk);
    if (!info.exists())
        return;
    const QByteArray owner = accounts.userNameById(info.ownerId());
    selectOrAdd(m_ui->owner_combo, owner.isEmpty() ? QString::number(info.ownerId()) : QString::fromLocal8Bit(owner));
    const auto group = accounts.groups().find(info.groupId());
    selectOrAdd(m_ui->group_combo,
                group == accounts.groups().end() ? QString::number(info.groupId())
                                                 : QString::fromLocal8Bit(group->second.name));
}

QList<PermissionsEditorDialog::PermissionBox> PermissionsEditorDialog::permissionBoxes() const
{
    return {{m_ui->fs_owner_read, QFileDevice::ReadOwner},   {m_ui->fs_owner_write, QFileDevice::WriteOwner},
            {m_ui->fs_owner_execute, QFileDevice::ExeOwner}, {m_ui->fs_group_read, QFileDevice::ReadGroup},
            {m_ui->fs_group_write, QFileDevice::WriteGroup}, {m_ui->fs_group_execute, QFileDevice::ExeGroup},
            {m_ui->fs_other_read, QFileDevice::ReadOther},   {m_ui->fs_other_write, QFileDevice::WriteOther},
            {m_ui->fs_other_execute, QFileDevice::ExeOther}};
}

QString PermissionsEditorDialog::rightsString() const
{
    const AppStrings &strings = AppStrings::instance();
    QStringList chosen;
    if (m_ui->ftp_write->isChecked())
        chosen << strings.write;
    // Upload and mkdir are enabled together; either one's state decides.
    if (m_ui->ftp_upload->isChecked() && m_ui->ftp_mkdir->isEnabled())
        chosen << strings.upload;
    if (m_ui->ftp_download->isChecked())
        chosen << strings.download;
    if (m_ui->ftp_mkdir->isChecked() && m_ui->ftp_mkdir->isEnabled())
        chosen << strings.mkdir;
    if (chosen.size() == 4)
        return strings.fullAccess;
    return chosen.join(separator);
}

QFileDevice::Permissions PermissionsEditorDialog::permissions() const
{
    QFileDevice::Permissions flags;
    for (const PermissionBox &entry : permissionBoxes()) {
        if (entry.box->isChecked())
            flags |= entry.flag;
    }
    return flags;
}

const QByteArray &PermissionsEditorDialog::directory() const
{
    return m_directory;
}

void PermissionsEditorDialog::enableDialogOkButton()
{
    m_ui->dialogButtonBox->button(QDialogButtonBox::Ok)->setEnabled(true);
}
