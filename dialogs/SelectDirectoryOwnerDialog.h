#pragma once

#include <QDialog>

#include <memory>

namespace Ui {
class SelectDirectoryOwnerDialog;
}

// Picks the system account that takes over an anonymous FTP root which the
// anonymous account itself owns.
class SelectDirectoryOwnerDialog : public QDialog
{
    Q_OBJECT

public:
    explicit SelectDirectoryOwnerDialog(const QStringList &accounts, QWidget *parent = nullptr);
    ~SelectDirectoryOwnerDialog() override;

    QString owner() const;

private:
    std::unique_ptr<Ui::SelectDirectoryOwnerDialog> m_ui;
};
