#pragma once

#include "trylogin/TryLogin.h"

#include <QDialog>
#include <QPersistentModelIndex>

#include <atomic>
#include <memory>

class QThread;
class QTreeWidget;
class QTreeWidgetItem;
class TreeModel;

namespace Ui {
class TryLoginDialog;
}

// "Try login": the password of the selected user goes through the PAM
// service and a real login to the local vsftpd, each step shown with its
// answer, beside the program's verdict and the forecast of that user. The
// trial runs on a worker thread; the password is dropped when it ends.
class TryLoginDialog : public QDialog
{
    Q_OBJECT

public:
    enum Column { StepColumn = 0, ResultColumn, ReplyColumn };

    TryLoginDialog(TreeModel &model, const QModelIndex &sourceUser, QWidget *parent = nullptr);
    ~TryLoginDialog() override;

    QTreeWidget *stepsTree() const;
    bool isRunning() const;

public slots:
    void start();
    void done(int result) override;

signals:
    void trialFinished();

private:
    void showVerdict();
    void addStep(const TryLoginStep &step);
    void onFinished();
    void stopWorker();

    std::unique_ptr<Ui::TryLoginDialog> m_ui;
    TreeModel &m_model;
    QPersistentModelIndex m_user;
    TryLoginRequest m_request;
    QThread *m_worker = nullptr;
    std::atomic_bool m_cancel{false};
    QTreeWidgetItem *m_stageItems[3] = {};
};
