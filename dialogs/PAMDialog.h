#pragma once

#include <QDialog>

#include <memory>

namespace Ui {
class PAMDialog;
}

// The exit codes of PAMDialog.
enum class PamDialogResult : int { Skip = 1, Valid = 2, Fix = 3 };

// Explains why the PAM file of the server does not let virtual users in and
// lets the administrator skip the problem this time, declare the file valid
// for good, or have it fixed.
class PAMDialog : public QDialog
{
    Q_OBJECT

public:
    explicit PAMDialog(QWidget *parent = nullptr);
    ~PAMDialog() override;

public Q_SLOTS:
    void skip();
    void valid();
    void fix();

private:
    std::unique_ptr<Ui::PAMDialog> m_ui;
};
