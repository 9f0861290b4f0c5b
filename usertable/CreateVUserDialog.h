#pragma once

#include <QDialog>
#include <QObject>

#include <memory>
#include <optional>
#include <utility>

class QDialogButtonBox;
class QLineEdit;

namespace Ui {
class CreateVUserDialog;
}

// Hands a signal's bool on to any callable, so that a lambda with state can
// sit behind a slot that a form or an older connection names.
class SignalCatcher : public QObject
{
    Q_OBJECT

public:
    struct HolderBase
    {
        virtual ~HolderBase() = default;
        virtual void call(bool value) = 0;
    };
    template <typename Function> struct Holder : HolderBase
    {
        explicit Holder(Function function)
            : function(std::move(function))
        {
        }
        void call(bool value) override
        {
            function(value);
        }
        Function function;
    };

    template <typename Function>
    SignalCatcher(Function function, QObject *parent)
        : QObject(parent)
        , m_holder(std::make_unique<Holder<Function>>(std::move(function)))
    {
    }

public slots:
    void onSignal(bool value);

private:
    std::unique_ptr<HolderBase> m_holder;
};

// The name and password of a virtual user, for a new one or to change one.
// Only exec() shows it; run() keeps it coming back until what was entered
// can be stored.
class CreateVUserDialog : public QDialog
{
    Q_OBJECT

public:
    explicit CreateVUserDialog(QWidget *parent = nullptr);
    ~CreateVUserDialog() override;

    // Fills the fields from the stored record and calls it an edit.
    void setUser(const QString &name, const QString &password);
    QString userName() const;
    QString password() const;

    QLineEdit *nameLineEdit() const;
    QLineEdit *passwordLineEdit() const;
    QLineEdit *confirmationLineEdit() const;
    QDialogButtonBox *buttonBox() const;

    // Shows the dialog until it is cancelled (false) or holds a name and a
    // confirmed password that may be stored (true). Each refusal is a
    // warning over the dialog's parent.
    bool run();

private:
    // Why the name cannot be a database key, a line of a list or a file
    // name of a per-user configuration; nothing when it can.
    static std::optional<QString> unusableNameReason(const QString &name);
    void warn(const QString &text);

    std::unique_ptr<Ui::CreateVUserDialog> m_ui;
    SignalCatcher *m_showPasswordCatcher = nullptr;
};
