#include "SavePreviewDialog.h"

#include "app/VexIntegration.h"
#include "ui_SavePreviewDialog.h"

#include <QFontDatabase>
#include <QPushButton>
#include <QStyle>
#include <QSyntaxHighlighter>

#include <algorithm>

namespace {

// The colours diff --color gives: the eye finds the changed lines first.
class DiffHighlighter : public QSyntaxHighlighter
{
public:
    using QSyntaxHighlighter::QSyntaxHighlighter;

protected:
    void highlightBlock(const QString &text) override
    {
        QTextCharFormat format;
        if (text.startsWith(QLatin1String("+++ ")) || text.startsWith(QLatin1String("--- "))) {
            format.setFontWeight(QFont::Bold);
        } else if (text.startsWith(QLatin1String("@@"))) {
            format.setForeground(QColor(0x00, 0x6b, 0x8f));
        } else if (text.startsWith(QLatin1Char('+'))) {
            format.setForeground(QColor(0x1a, 0x7f, 0x37));
        } else if (text.startsWith(QLatin1Char('-'))) {
            format.setForeground(QColor(0xcf, 0x22, 0x2e));
        } else {
            return;
        }
        setFormat(0, text.size(), format);
    }
};

} // namespace

SavePreviewDialog::SavePreviewDialog(FtpServerConfig::SavePlan plan, QWidget *parent)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::SavePreviewDialog>())
    , m_plan(std::move(plan))
{
    m_ui->setupUi(this);
    const bool database = !m_plan.virtualUsersPath.isEmpty();
    const int count = static_cast<int>(m_plan.files.size()) + (database ? 1 : 0);
    m_ui->summaryLabel->setText(
        tr("Save writes %n file(s). Each file it replaces is kept beside it as FILE.ftpconfig-bak. "
           "Nothing is written until you click Save.",
           nullptr, count));

    for (const FtpServerConfig::PlannedFile &file : m_plan.files)
        m_ui->filesListWidget->addItem(file.exists ? file.path : tr("%1 (new file)").arg(file.path));
    if (database)
        m_ui->filesListWidget->addItem(tr("%1 (virtual users)").arg(QFile::decodeName(m_plan.virtualUsersPath)));
    m_texts.resize(static_cast<size_t>(count));

    m_ui->diffPlainTextEdit->setFont(QFontDatabase::systemFont(QFontDatabase::FixedFont));
    new DiffHighlighter(m_ui->diffPlainTextEdit->document());
    // The paths whole where the dialog has room, the diff the rest.
    m_ui->verticalLayout->setStretch(1, 1);
    QListWidget *list = m_ui->filesListWidget;
    const int listWidth = std::min(list->sizeHintForColumn(0) + 2 * list->frameWidth()
                                       + list->style()->pixelMetric(QStyle::PM_ScrollBarExtent),
                                   width() / 2);
    m_ui->previewSplitter->setSizes({listWidth, width() - listWidth});
    m_ui->previewSplitter->setStretchFactor(1, 1);
    m_ui->buttonBox->button(QDialogButtonBox::Save)->setDefault(true);
    connect(m_ui->buttonBox, &QDialogButtonBox::accepted, this, &QDialog::accept);
    connect(m_ui->buttonBox, &QDialogButtonBox::rejected, this, &QDialog::reject);
    connect(m_ui->filesListWidget, &QListWidget::currentRowChanged, this, &SavePreviewDialog::showEntry);
    m_ui->filesListWidget->setCurrentRow(0);
    vexRestoreGeometry(this);
}

SavePreviewDialog::~SavePreviewDialog() = default;

QListWidget *SavePreviewDialog::filesList() const
{
    return m_ui->filesListWidget;
}

QPlainTextEdit *SavePreviewDialog::diffView() const
{
    return m_ui->diffPlainTextEdit;
}

void SavePreviewDialog::done(int result)
{
    vexSaveGeometry(this);
    QDialog::done(result);
}

void SavePreviewDialog::showEntry(int row)
{
    if (row < 0 || static_cast<size_t>(row) >= m_texts.size()) {
        m_ui->diffPlainTextEdit->clear();
        return;
    }
    QString &text = m_texts[static_cast<size_t>(row)];
    if (text.isNull()) {
        const auto index = static_cast<size_t>(row);
        text = index < m_plan.files.size() ? QString::fromUtf8(m_plan.files[index].diff()) : virtualUsersText();
    }
    m_ui->diffPlainTextEdit->setPlainText(text);
}

QString SavePreviewDialog::virtualUsersText() const
{
    QStringList lines{
        tr("Virtual users database %1; passwords are not shown.").arg(QFile::decodeName(m_plan.virtualUsersPath)),
        QString()};
    for (const QByteArray &name : m_plan.addedVirtualUsers)
        lines << tr("added: %1").arg(QString::fromUtf8(name));
    for (const auto &[name, previous] : m_plan.changedVirtualUsers) {
        lines << (previous.isEmpty()
                      ? tr("new password: %1").arg(QString::fromUtf8(name))
                      : tr("renamed: %1 to %2").arg(QString::fromUtf8(previous), QString::fromUtf8(name)));
    }
    for (const QByteArray &name : m_plan.removedVirtualUsers)
        lines << tr("removed: %1").arg(QString::fromUtf8(name));
    return lines.join(QLatin1Char('\n')) + QLatin1Char('\n');
}
