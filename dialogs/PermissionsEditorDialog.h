#pragma once

#include <QByteArray>
#include <QDialog>
#include <QFileDevice>

#include <memory>

class FtpServerConfig;
class QCheckBox;

namespace Ui {
class PermissionsEditorDialog;
}

// Edits what a user may do over FTP and the permission bits of the user's
// FTP root. It offers to create a missing root; the caller applies the
// results once the dialog was accepted.
class PermissionsEditorDialog : public QDialog
{
    Q_OBJECT

public:
    // rights: the mode cell's text ("write, download", "full access").
    PermissionsEditorDialog(const QString &rights, FtpServerConfig &config, const QByteArray &user,
                            QWidget *parent = nullptr);
    ~PermissionsEditorDialog() override;

    QString rightsString() const;
    QFileDevice::Permissions permissions() const;
    // The FTP root whose bits the dialog shows, as the administrator knows
    // it; empty when the user has none of its own.
    const QByteArray &directory() const;

public slots:
    void enableDialogOkButton();

private:
    struct PermissionBox
    {
        QCheckBox *box;
        QFileDevice::Permission flag;
    };
    QList<PermissionBox> permissionBoxes() const;
    void offerToCreate(const QString &onDisk);
    void fillOwners(const QString &onDisk);

    std::unique_ptr<Ui::PermissionsEditorDialog> m_ui;
    FtpServerConfig &m_config;
    QByteArray m_user;
    QByteArray m_directory;
};
