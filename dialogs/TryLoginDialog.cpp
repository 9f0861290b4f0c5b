#include "TryLoginDialog.h"

#include "ForecastIcons.h"
#include "WrappingDelegate.h"
#include "forecast/LoginForecast.h"
#include "policy/AccessFailure.h"
#include "ui_TryLoginDialog.h"
#include "usertable/TreeModel.h"

#include <QHeaderView>
#include <QPushButton>
#include <QStyle>
#include <QThread>
#include <QTreeWidget>

namespace {

QIcon outcomeIcon(const QStyle *style, TryLoginStep::Outcome outcome)
{
    switch (outcome) {
    case TryLoginStep::Outcome::Passed:
        return style->standardIcon(QStyle::SP_DialogApplyButton);
    case TryLoginStep::Outcome::Failed:
        return style->standardIcon(QStyle::SP_DialogCancelButton);
    case TryLoginStep::Outcome::Skipped:
        break;
    }
    return style->standardIcon(QStyle::SP_MessageBoxInformation);
}

void setRow(QTreeWidgetItem *item, const QString &step, const QString &result, const QString &reply)
{
    item->setText(TryLoginDialog::StepColumn, step);
    item->setText(TryLoginDialog::ResultColumn, result);
    item->setText(TryLoginDialog::ReplyColumn, reply);
    item->setToolTip(TryLoginDialog::ReplyColumn, reply);
}

} // namespace

TryLoginDialog::TryLoginDialog(TreeModel &model, const QModelIndex &sourceUser, QWidget *parent)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::TryLoginDialog>())
    , m_model(model)
    , m_user(sourceUser.siblingAtColumn(TreeModel::UsersColumn))
{
    m_ui->setupUi(this);
    const QString name = m_model.userName(m_user);
    setWindowTitle(tr("Try login: %1").arg(name));
    m_request = TryLoginRequest::fromConfig(m_model.config(), name.toUtf8());

    QString where;
    if (m_request.skipReason.isEmpty()) {
        where = tr("User %1, PAM service \"%2\", vsftpd on %3:%4")
                    .arg(name, QString::fromLocal8Bit(m_request.pamService), m_request.address)
                    .arg(m_request.port);
        if (m_request.tls)
            where += tr(", then again over explicit TLS (the server's certificate is accepted unchecked)");
        where += QLatin1Char('.');
    } else {
        where = tr("User %1. %2").arg(name, m_request.skipReason);
    }
    if (m_request.anonymous)
        where += QLatin1Char(' ') + tr("The login is \"anonymous\"; its password is any e-mail address.");
    // The server and PAM read the files on disk, not the edits in memory.
    if (m_model.hasUnsavedChanges())
        where += QLatin1Char(' ') + tr("Unsaved changes are not part of this trial.");
    m_ui->whereLabel->setText(where);

    // Replies and refusals run long: they wrap rather than hide their end.
    WrappingDelegate::install(m_ui->stepsTreeWidget, ReplyColumn);
    m_ui->stepsTreeWidget->header()->setStretchLastSection(true);
    connect(m_ui->tryPushButton, &QPushButton::clicked, this, &TryLoginDialog::start);
    connect(m_ui->buttonBox, &QDialogButtonBox::rejected, this, &QDialog::reject);
    showVerdict();
}

TryLoginDialog::~TryLoginDialog()
{
    stopWorker();
}

QTreeWidget *TryLoginDialog::stepsTree() const
{
    return m_ui->stepsTreeWidget;
}

bool TryLoginDialog::isRunning() const
{
    return m_worker != nullptr;
}

void TryLoginDialog::showVerdict()
{
    QTreeWidget *tree = m_ui->stepsTreeWidget;
    tree->clear();
    for (QTreeWidgetItem *&item : m_stageItems)
        item = nullptr;
    auto *verdict = new QTreeWidgetItem(tree);
    const AccessFailure failure = m_model.failure(m_user).value_or(AccessFailure());
    QString message = failure.message;
    if (failure.kind != FailureKind::None)
        message = failureKindText(failure.kind) + QStringLiteral(": ") + message;
    setRow(verdict, tr("Program's verdict"),
           m_model.data(QModelIndex(m_user).siblingAtColumn(TreeModel::StatusColumn)).toString(), message);
    verdict->setIcon(ResultColumn, m_model.data(m_user, Qt::DecorationRole).value<QIcon>());

    auto *forecastItem = new QTreeWidgetItem(tree);
    const UserForecast forecast = m_model.forecast(m_user).value_or(UserForecast());
    setRow(forecastItem, tr("Server forecast"), forecastStatusText(forecast.status),
           forecast.findings.isEmpty() ? tr("No findings.") : QString());
    forecastItem->setIcon(ResultColumn, forecastStatusIcon(forecast.status));
    for (const ForecastFinding &finding : forecast.findings) {
        auto *item = new QTreeWidgetItem(forecastItem);
        setRow(item, QString(), severityText(finding.severity), finding.message);
        item->setIcon(ResultColumn, severityIcon(finding.severity));
    }
    tree->expandAll();
    tree->resizeColumnToContents(StepColumn);
    tree->resizeColumnToContents(ResultColumn);
}

void TryLoginDialog::start()
{
    if (m_worker)
        return;
    showVerdict();
    m_ui->tryPushButton->setEnabled(false);
    m_ui->passwordLineEdit->setEnabled(false);
    m_ui->stateLabel->setText(tr("Trying..."));
    m_cancel = false;

    TryLoginRequest request = m_request;
    QString typed = m_ui->passwordLineEdit->text();
    request.password = typed.toUtf8();
    typed.fill(QChar(0));
    // Steps come back through the event loop: the dialog waits for the
    // worker before it goes, so none can reach a deleted dialog.
    m_worker = QThread::create([this, request]() mutable {
        tryLogin(
            request,
            [this](const TryLoginStep &step) {
                QMetaObject::invokeMethod(
                    this, [this, step] { addStep(step); }, Qt::QueuedConnection);
            },
            m_cancel);
        request.password.fill('\0');
        request.password.clear();
        QMetaObject::invokeMethod(this, &TryLoginDialog::onFinished, Qt::QueuedConnection);
    });
    request.password.fill('\0');
    m_worker->start();
}

void TryLoginDialog::addStep(const TryLoginStep &step)
{
    QTreeWidget *tree = m_ui->stepsTreeWidget;
    QTreeWidgetItem *&stage = m_stageItems[int(step.stage)];
    if (!stage) {
        stage = new QTreeWidgetItem(tree);
        stage->setText(StepColumn, stageText(step.stage));
    }
    auto *item = new QTreeWidgetItem(stage);
    setRow(item, step.command, outcomeText(step.outcome), step.text);
    item->setIcon(ResultColumn, outcomeIcon(style(), step.outcome));
    // A stage shows its first failure, or else its last step's result.
    const QString failed = outcomeText(TryLoginStep::Outcome::Failed);
    if (stage->text(ResultColumn) != failed) {
        stage->setText(ResultColumn, outcomeText(step.outcome));
        stage->setIcon(ResultColumn, outcomeIcon(style(), step.outcome));
    }
    stage->setExpanded(true);
    tree->resizeColumnToContents(StepColumn);
    tree->resizeColumnToContents(ResultColumn);
}

void TryLoginDialog::onFinished()
{
    stopWorker();
    m_ui->tryPushButton->setEnabled(true);
    m_ui->passwordLineEdit->setEnabled(true);
    m_ui->stateLabel->setText(tr("Done."));
    emit trialFinished();
}

void TryLoginDialog::stopWorker()
{
    if (!m_worker)
        return;
    // Each step of the worker is bounded; the one under way ends by itself.
    m_cancel = true;
    m_worker->wait();
    delete m_worker;
    m_worker = nullptr;
}

void TryLoginDialog::done(int result)
{
    stopWorker();
    m_ui->passwordLineEdit->clear();
    QDialog::done(result);
}
