#include "CreateVUserDialog.h"

#include "common/SafeFile.h"
#include "ui_CreateVUserDialog.h"

#include <QCheckBox>
#include <QDialogButtonBox>
#include <QLineEdit>
#include <QMessageBox>

void SignalCatcher::onSignal(bool value)
{
    m_holder->call(value);
}

CreateVUserDialog::CreateVUserDialog(QWidget *parent)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::CreateVUserDialog>())
{
    m_ui->setupUi(this);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::accepted, this, &QDialog::accept);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::rejected, this, &QDialog::reject);
}

CreateVUserDialog::~CreateVUserDialog() = default;

void CreateVUserDialog::setUser(const QString &name, const QString &password)
{
    setWindowTitle(tr("Edit virtual user"));
    m_ui->nameLineEdit->setText(name);
    m_ui->passwordLineEdit->setText(password);
    m_ui->confirmationLineEdit->setText(password);
}

QString CreateVUserDialog::userName() const
{
    return m_ui->nameLineEdit->text();
}

QString CreateVUserDialog::password() const
{
    return m_ui->passwordLineEdit->text();
}

QLineEdit *CreateVUserDialog::nameLineEdit() const
{
    return m_ui->nameLineEdit;
}

QLineEdit *CreateVUserDialog::passwordLineEdit() const
{
    return m_ui->passwordLineEdit;
}

QLineEdit *CreateVUserDialog::confirmationLineEdit() const
{
    return m_ui->confirmationLineEdit;
}

QDialogButtonBox *CreateVUserDialog::buttonBox() const
{
    return m_ui->dialogButtonBox;
}

bool CreateVUserDialog::run()
{
    if (!m_showPasswordCatcher) {
        m_showPasswordCatcher = new SignalCatcher(
            [this](bool shown) {
                const QLineEdit::EchoMode mode = shown ? QLineEdit::Normal : QLineEdit::Password;
                m_ui->passwordLineEdit->setEchoMode(mode);
                m_ui->confirmationLineEdit->setEchoMode(mode);
            },
            this);
        connect(m_ui->showPasswordCheckBox, &QCheckBox::toggled, m_showPasswordCatcher, &SignalCatcher::onSignal);
    }
    const auto clearPasswords = [this] {
        m_ui->passwordLineEdit->clear();
        m_ui->confirmationLineEdit->clear();
    };
    // The order matters to the administrator: a typing mistake in the
    // password is the likelier one and is reported first.
    while (exec() == QDialog::Accepted) {
        if (password() != m_ui->confirmationLineEdit->text()) {
            warn(tr("Passwords are not equal."));
            clearPasswords();
        } else if (password().isEmpty()) {
            warn(tr("Password must have length greater than zero."));
            clearPasswords();
        } else if (userName().isEmpty()) {
            warn(tr("User name length must be greater that zero"));
        } else if (const auto reason = unusableNameReason(userName())) {
            warn(tr("Virtual user name \"%1\" cannot be used: %2.").arg(userName(), *reason));
        } else {
            return true;
        }
    }
    return false;
}

std::optional<QString> CreateVUserDialog::unusableNameReason(const QString &name)
{
    if (auto reason = invalidNameReason(name.toUtf8()))
        return reason;
    // The name is also a line of the user lists, read word by word by
    // vsftpd and PAM: a blank of any kind would split it.
    for (const QChar c : name) {
        if (c.category() == QChar::Other_Control)
            return tr("the name contains a control character");
        if (c.isSpace())
            return tr("the name contains a blank");
    }
    return std::nullopt;
}

void CreateVUserDialog::warn(const QString &text)
{
    QMessageBox::warning(parentWidget() ? parentWidget() : this, windowTitle(), text);
}
