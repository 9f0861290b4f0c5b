#include "PAMDialog.h"

#include "ui_PAMDialog.h"

#include <QPushButton>

PAMDialog::PAMDialog(QWidget *parent)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::PAMDialog>())
{
    m_ui->setupUi(this);
    connect(m_ui->skip_button, &QPushButton::clicked, this, &PAMDialog::skip);
    connect(m_ui->valid_button, &QPushButton::clicked, this, &PAMDialog::valid);
    connect(m_ui->fix_button, &QPushButton::clicked, this, &PAMDialog::fix);
}

PAMDialog::~PAMDialog() = default;

void PAMDialog::skip()
{
    done(static_cast<int>(PamDialogResult::Skip));
}

void PAMDialog::valid()
{
    done(static_cast<int>(PamDialogResult::Valid));
}

void PAMDialog::fix()
{
    done(static_cast<int>(PamDialogResult::Fix));
}
