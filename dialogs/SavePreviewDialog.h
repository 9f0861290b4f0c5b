#pragma once

#include "policy/FtpServerConfig.h"

#include <QDialog>

#include <memory>

class QListWidget;
class QPlainTextEdit;

namespace Ui {
class SavePreviewDialog;
}

// What Save is about to write, before anything is written: each file with
// the unified diff from its text on disk, and the virtual users database as
// the names added, changed and removed (never a password). Read-only;
// Save accepts, Cancel writes nothing.
class SavePreviewDialog : public QDialog
{
    Q_OBJECT

public:
    explicit SavePreviewDialog(FtpServerConfig::SavePlan plan, QWidget *parent = nullptr);
    ~SavePreviewDialog() override;

    QListWidget *filesList() const;
    // The text shown for the selected entry.
    QPlainTextEdit *diffView() const;

    void done(int result) override;

private:
    void showEntry(int row);
    QString virtualUsersText() const;

    std::unique_ptr<Ui::SavePreviewDialog> m_ui;
    FtpServerConfig::SavePlan m_plan;
    // Made when first shown: a save of a thousand per-user files need not
    // compare them all before the dialog opens.
    std::vector<QString> m_texts;
};
