#include "SelectDirectoryOwnerDialog.h"

#include "ui_SelectDirectoryOwnerDialog.h"

#include <QIcon>

SelectDirectoryOwnerDialog::SelectDirectoryOwnerDialog(const QStringList &accounts, QWidget *parent)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::SelectDirectoryOwnerDialog>())
{
    m_ui->setupUi(this);
    for (const QString &account : accounts)
        m_ui->ownerComboBox->addItem(QIcon(), account);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::accepted, this, &QDialog::accept);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::rejected, this, &QDialog::reject);
}

SelectDirectoryOwnerDialog::~SelectDirectoryOwnerDialog() = default;

QString SelectDirectoryOwnerDialog::owner() const
{
    return m_ui->ownerComboBox->currentText();
}
