// Applies one administrator's edit through the main window's widgets and
// saves with its Save action: the end-to-end tests use it to show that what
// the dialogs and the status editor do reaches the real server.
//   windowedit --root DIR vadd NAME PASSWORD
//   windowedit --root DIR vchange OLD NEW PASSWORD
//   windowedit --root DIR vdelete NAME
//   windowedit --root DIR grant USER
//   windowedit --root DIR deny USER
//   windowedit --root DIR options WIDGET=VALUE...
// The options edit sets widgets of the options dialog by object name, each
// on its page as the administrator turns to it, and must change every page:
// "on"/"off" for check boxes, radio buttons and checkable group boxes, the
// text of a line or text edit or of a combo entry, the number of a spin box,
// the comma-separated entries to select in a list; any other button is
// clicked, with an empty VALUE once, otherwise once per comma-separated
// piece, the piece typed into the input dialog it opens. Then OK.
// Every box and dialog is answered the way editchild answers the engine:
// with its accepting button; each one's text goes to stderr. Prints
// "done saved" and exits 0 when the edit took and the save reported nothing.
#include "ModalHelper.h"
#include "WindowFixture.h"
#include "app/CMainWindow.h"
#include "app/Server.h"
#include "common/AppStrings.h"
#include "dialogs/PAMDialog.h"
#include "dialogs/SavePreviewDialog.h"
#include "dialogs/SelectDirectoryOwnerDialog.h"
#include "options/COptionsDialog.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/CreateVUserDialog.h"
#include "usertable/TreeModel.h"

#include <QAction>
#include <QApplication>
#include <QCheckBox>
#include <QComboBox>
#include <QDBusConnection>
#include <QDoubleSpinBox>
#include <QGroupBox>
#include <QInputDialog>
#include <QLineEdit>
#include <QListWidget>
#include <QMap>
#include <QPlainTextEdit>
#include <QPushButton>
#include <QRadioButton>
#include <QSet>
#include <QSpinBox>
#include <QStackedWidget>
#include <QTemporaryDir>
#include <QTest>

#include <cstdio>
#include <iostream>
#include <memory>
#include <optional>

namespace {

// What the administrator types into the virtual user dialog.
struct Typed
{
    QString name;
    QString password;
};

// One widget of the options dialog and what it is set to.
struct Setting
{
    QString widget;
    QString value;
};

// A widget's state in the words of a setting; a null string for a kind of
// widget that has none (a push button).
QString stateOf(const QWidget *widget)
{
    const auto onOff = [](bool on) { return on ? QStringLiteral("on") : QStringLiteral("off"); };
    if (auto *button = qobject_cast<const QAbstractButton *>(widget))
        return button->isCheckable() ? onOff(button->isChecked()) : QString();
    if (auto *group = qobject_cast<const QGroupBox *>(widget))
        return group->isCheckable() ? onOff(group->isChecked()) : QString();
    if (auto *edit = qobject_cast<const QLineEdit *>(widget))
        return edit->text();
    if (auto *edit = qobject_cast<const QPlainTextEdit *>(widget))
        return edit->toPlainText();
    if (auto *list = qobject_cast<const QListWidget *>(widget)) {
        QStringList selected;
        for (const QListWidgetItem *item : list->selectedItems())
            selected << item->text();
        return selected.join(QLatin1Char(','));
    }
    if (auto *combo = qobject_cast<const QComboBox *>(widget))
        return combo->currentText();
    if (auto *spin = qobject_cast<const QSpinBox *>(widget))
        return QString::number(spin->value());
    if (auto *spin = qobject_cast<const QDoubleSpinBox *>(widget))
        return QString::number(spin->value());
    return QString();
}

// Sets the widget as the administrator would: clicks, keys, a choice.
void setState(QWidget *widget, const QString &value)
{
    if (auto *button = qobject_cast<QAbstractButton *>(widget)) {
        if (stateOf(button) != value)
            button->click();
    } else if (auto *group = qobject_cast<QGroupBox *>(widget)) {
        group->setChecked(value == QLatin1String("on"));
    } else if (auto *edit = qobject_cast<QLineEdit *>(widget)) {
        edit->selectAll();
        QTest::keyClick(edit, Qt::Key_Delete);
        QTest::keyClicks(edit, value);
    } else if (auto *text = qobject_cast<QPlainTextEdit *>(widget)) {
        text->selectAll();
        QTest::keyClick(text, Qt::Key_Delete);
        QTest::keyClicks(text, value);
    } else if (auto *list = qobject_cast<QListWidget *>(widget)) {
        list->clearSelection();
        for (const QString &entry : value.split(QLatin1Char(','))) {
            for (QListWidgetItem *item : list->findItems(entry, Qt::MatchExactly))
                item->setSelected(true);
        }
    } else if (auto *combo = qobject_cast<QComboBox *>(widget)) {
        combo->setCurrentIndex(combo->findText(value));
    } else if (auto *spin = qobject_cast<QSpinBox *>(widget)) {
        spin->setValue(value.toInt());
    } else if (auto *spin = qobject_cast<QDoubleSpinBox *>(widget)) {
        spin->setValue(value.toDouble());
    }
}

// Answers whatever comes up, in the order it comes, and keeps what was
// wrong: the edit's own dialog is filled once (a second showing means the
// dialog refused what was typed), every question gets its accepting button,
// and a warning with nothing to choose is a refusal.
class Answerer
{
public:
    explicit Answerer(ModalHelper &modal)
        : m_modal(modal)
    {
        arm();
    }

    void setTyped(const Typed &typed)
    {
        m_typed = typed;
    }
    void setOptions(const QList<Setting> &settings)
    {
        m_settings = settings;
    }
    bool optionsAccepted() const
    {
        return m_optionsAccepted;
    }
    // A refusal while saving is the save's: it failed.
    void setSaving(bool saving)
    {
        m_saving = saving;
    }
    bool saveRefused() const
    {
        return m_saveRefused;
    }
    const QStringList &problems() const
    {
        return m_problems;
    }

private:
    // One expectation at a time, re-armed by each answer: how many
    // questions a repair asks depends on the files.
    void arm()
    {
        m_modal.expect(QString(), [this](QWidget *widget) {
            arm();
            answer(widget);
        });
    }

    void answer(QWidget *widget)
    {
        if (auto *box = qobject_cast<QMessageBox *>(widget))
            return answerBox(box);
        std::fprintf(stderr, "dialog: %s\n", qPrintable(widget->windowTitle()));
        if (auto *dialog = qobject_cast<CreateVUserDialog *>(widget))
            return fill(dialog);
        if (auto *dialog = qobject_cast<COptionsDialog *>(widget))
            return fill(dialog);
        if (qobject_cast<SavePreviewDialog *>(widget)) {
            if (!ModalHelper::press(widget, QDialogButtonBox::Save))
                refuse(widget, QStringLiteral("no Save button"));
            return;
        }
        if (auto *input = qobject_cast<QInputDialog *>(widget)) {
            auto *edit = input->findChild<QLineEdit *>();
            if (m_inputs.isEmpty() || !edit)
                return refuse(input, QStringLiteral("nothing to type"));
            QTest::keyClicks(edit, m_inputs.takeFirst());
            if (!ModalHelper::press(input, QDialogButtonBox::Ok))
                refuse(input, QStringLiteral("OK not enabled"));
            return;
        }
        if (auto *pam = qobject_cast<PAMDialog *>(widget)) {
            // As editchild: the PAM configuration is taken as it is.
            if (auto *valid = pam->findChild<QPushButton *>(QStringLiteral("valid_button")))
                return valid->click();
            return refuse(widget, QStringLiteral("no valid button"));
        }
        if (auto *owner = qobject_cast<SelectDirectoryOwnerDialog *>(widget)) {
            auto *combo = owner->findChild<QComboBox *>(QStringLiteral("ownerComboBox"));
            combo->setCurrentIndex(combo->findText(QStringLiteral("root")));
        }
        if (!ModalHelper::press(widget, QDialogButtonBox::Ok))
            refuse(widget, QStringLiteral("no OK button"));
    }

    void answerBox(QMessageBox *box)
    {
        std::fprintf(stderr, "box: %s | %s | %s\n", qPrintable(box->windowTitle()), qPrintable(box->text()),
                     qPrintable(box->informativeText()));
        if (!box->detailedText().isEmpty())
            std::fprintf(stderr, "     %s\n", qPrintable(box->detailedText()));
        int answers = 0;
        for (QAbstractButton *button : box->buttons())
            answers += box->buttonRole(button) != QMessageBox::ActionRole; // not "Show Details..."
        if (answers == 1 && (box->icon() == QMessageBox::Warning || box->icon() == QMessageBox::Critical)) {
            if (m_saving)
                m_saveRefused = true;
            else
                m_problems << QStringLiteral("refused: ") + box->text();
        }
        // The engine's own accepting button first (it carries the action's
        // name, "Create", "Fix"), then Yes, then OK.
        QAbstractButton *accepting = nullptr;
        for (QAbstractButton *button : box->buttons()) {
            if (box->buttonRole(button) == QMessageBox::AcceptRole
                && box->standardButton(button) == QMessageBox::NoButton)
                accepting = button;
        }
        for (const QMessageBox::StandardButton standard : {QMessageBox::Yes, QMessageBox::Ok}) {
            if (!accepting)
                accepting = box->button(standard);
        }
        if (!accepting)
            return refuse(box, QStringLiteral("no accepting button"));
        accepting->click();
    }

    void fill(CreateVUserDialog *dialog)
    {
        if (m_filled || !m_typed)
            return refuse(dialog, m_filled ? QStringLiteral("shown again") : QStringLiteral("not asked for"));
        m_filled = true;
        // Typed key by key, as the Ok button waits for the first edit.
        for (QLineEdit *edit : {dialog->nameLineEdit(), dialog->passwordLineEdit(), dialog->confirmationLineEdit()}) {
            edit->selectAll();
            QTest::keyClick(edit, Qt::Key_Delete);
            QTest::keyClicks(edit, edit == dialog->nameLineEdit() ? m_typed->name : m_typed->password);
        }
        if (!ModalHelper::press(dialog, QDialogButtonBox::Ok))
            refuse(dialog, QStringLiteral("OK not enabled"));
    }

    // Each setting on its page, turned to through the page list; every page
    // changed once at least, then OK.
    void fill(COptionsDialog *dialog)
    {
        if (m_filled || m_settings.isEmpty())
            return refuse(dialog, m_filled ? QStringLiteral("shown again") : QStringLiteral("not asked for"));
        m_filled = true;
        auto *pageList = dialog->findChild<QListWidget *>(QStringLiteral("pagesListWidget"));
        auto *pages = dialog->findChild<QStackedWidget *>(QStringLiteral("pagesStackedWidget"));
        if (!pageList || !pages)
            return refuse(dialog, QStringLiteral("no pages"));
        QSet<int> changed;
        for (const Setting &setting : qAsConst(m_settings)) {
            QWidget *widget = dialog->findChild<QWidget *>(setting.widget);
            int page = 0;
            while (widget && page < pages->count() && !pages->widget(page)->isAncestorOf(widget))
                ++page;
            if (!widget || page == pages->count()) {
                m_problems << QStringLiteral("no widget %1 on a page").arg(setting.widget);
                continue;
            }
            const QString title = pageList->item(page)->text();
            pageList->setCurrentRow(page);
            if (pages->currentIndex() != page || !widget->isVisible() || !widget->isEnabled()) {
                m_problems << QStringLiteral("%1 is not offered on the page \"%2\"").arg(setting.widget, title);
                continue;
            }
            const QString before = stateOf(widget);
            if (auto *button = qobject_cast<QAbstractButton *>(widget); button && before.isNull()) {
                if (setting.value.isEmpty())
                    button->click();
                // A button that asks for what to add, once a piece.
                for (const QString &piece : setting.value.split(QLatin1Char(','), Qt::SkipEmptyParts)) {
                    m_inputs << piece;
                    button->click();
                }
                if (!m_inputs.isEmpty()) {
                    m_problems
                        << QStringLiteral("%1 did not ask for %2").arg(setting.widget, m_inputs.join(QLatin1Char(',')));
                    m_inputs.clear();
                    continue;
                }
            } else {
                setState(widget, setting.value);
                if (before == setting.value || stateOf(widget) != setting.value) {
                    m_problems << QStringLiteral("%1 on \"%2\": \"%3\" before, \"%4\" now, \"%5\" wanted")
                                      .arg(setting.widget, title, before, stateOf(widget), setting.value);
                    continue;
                }
            }
            std::fprintf(stderr, "options: %s: %s=%s\n", qPrintable(title), qPrintable(setting.widget),
                         qPrintable(setting.value));
            changed.insert(page);
        }
        for (int page = 0; page < pages->count(); ++page) {
            if (!changed.contains(page))
                m_problems << QStringLiteral("nothing changed on the page \"%1\"").arg(pageList->item(page)->text());
        }
        if (!ModalHelper::press(dialog, QDialogButtonBox::Ok))
            return refuse(dialog, QStringLiteral("no OK button"));
        // A refused value leaves the dialog open.
        m_optionsAccepted = dialog->result() == QDialog::Accepted && !dialog->isVisible();
        if (!m_optionsAccepted)
            refuse(dialog, QStringLiteral("OK did not close it"));
    }

    void refuse(QWidget *widget, const QString &why)
    {
        m_problems << QStringLiteral("\"%1\": %2").arg(widget->windowTitle(), why);
        if (auto *dialog = qobject_cast<QDialog *>(widget))
            dialog->reject();
        else
            widget->close();
    }

    ModalHelper &m_modal;
    std::optional<Typed> m_typed;
    QList<Setting> m_settings;
    QStringList m_inputs;
    bool m_filled = false;
    bool m_optionsAccepted = false;
    bool m_saving = false;
    bool m_saveRefused = false;
    QStringList m_problems;
};

// The shown row of a user (or a group), at the column.
QModelIndex rowOf(const CMainWindow &window, const QString &name, int column)
{
    return window.proxy()->mapFromSource(WindowFixture::find(*window.model(), name, column));
}

// Triggers the action as the menu would: only when it is offered.
bool trigger(const CMainWindow &window, const char *name, QStringList &problems)
{
    auto *action = window.findChild<QAction *>(QLatin1String(name));
    if (!action || !action->isVisible() || !action->isEnabled()) {
        problems << QStringLiteral("%1 is not offered").arg(QLatin1String(name));
        return false;
    }
    action->trigger();
    return true;
}

// Clicks the user's row, as the administrator does before Edit or Delete.
bool select(const CMainWindow &window, const QString &name, QStringList &problems)
{
    const QModelIndex row = rowOf(window, name, TreeModel::UsersColumn);
    if (!row.isValid()) {
        problems << QStringLiteral("no row %1").arg(name);
        return false;
    }
    window.view()->setCurrentIndex(row);
    return true;
}

// Opens the status cell's editor and chooses the status in its combo, whose
// choice the delegate commits at once.
bool chooseStatus(const CMainWindow &window, const QString &user, const QString &status, QStringList &problems)
{
    const QModelIndex cell = rowOf(window, user, TreeModel::StatusColumn);
    if (!cell.isValid()) {
        problems << QStringLiteral("no row %1").arg(user);
        return false;
    }
    window.view()->setCurrentIndex(cell);
    window.view()->edit(cell);
    auto *combo = qobject_cast<QComboBox *>(window.view()->indexWidget(cell));
    if (!combo) {
        problems << QStringLiteral("no status editor for %1").arg(user);
        return false;
    }
    const int wanted = combo->findText(status);
    if (wanted < 0 || combo->currentIndex() == wanted) {
        problems << QStringLiteral("the editor of %1 opens on \"%2\"").arg(user, combo->currentText());
        return false;
    }
    combo->setCurrentIndex(wanted);
    // The administrator moves on to the next row.
    window.view()->setCurrentIndex(rowOf(window, user, TreeModel::UsersColumn));
    return true;
}

int usage()
{
    std::fputs("usage: windowedit --root DIR vadd NAME PASSWORD | vchange OLD NEW PASSWORD | vdelete NAME"
               " | grant USER | deny USER | options WIDGET=VALUE...\n",
               stderr);
    return 2;
}

} // namespace

int main(int argc, char **argv)
{
    if (qEnvironmentVariableIsEmpty("QT_QPA_PLATFORM"))
        qputenv("QT_QPA_PLATFORM", "offscreen");
    // The window keeps its state in the settings: a directory of its own,
    // so that nothing of this run reaches another.
    QTemporaryDir settings;
    qputenv("XDG_CONFIG_HOME", QFile::encodeName(settings.path()));
    QApplication app(argc, argv);
    QApplication::setQuitOnLastWindowClosed(false);
    const QStringList args = QCoreApplication::arguments();
    if (args.size() < 5 || args[1] != QLatin1String("--root") || !settings.isValid())
        return usage();
    qputenv("FTPCONFIG_ROOT", QFile::encodeName(args[2]));
    const QString operation = args[3];
    const QString user = args[4];
    QList<Setting> options;
    for (const QString &arg : args.mid(4)) {
        const int equals = arg.indexOf(QLatin1Char('='));
        if (operation == QLatin1String("options") && equals <= 0)
            return usage();
        options.append({arg.left(equals), arg.mid(equals + 1)});
    }
    const QMap<QString, int> argumentCounts{{QStringLiteral("vadd"), 6},
                                            {QStringLiteral("vchange"), 7},
                                            {QStringLiteral("vdelete"), 5},
                                            {QStringLiteral("grant"), 5},
                                            {QStringLiteral("deny"), 5}};
    if (operation != QLatin1String("options") && args.size() != argumentCounts.value(operation))
        return usage();
    const bool virtualEdit = operation.startsWith(QLatin1Char('v'));

    // Nothing on this machine is started or stopped.
    Server server(QDBusConnection(QStringLiteral("ftpconfig-no-bus")));
    ModalHelper modal(30000);
    Answerer answerer(modal);
    QStringList problems;
    std::streambuf *out = std::cout.rdbuf(std::cerr.rdbuf());
    auto window = std::make_unique<CMainWindow>(server);
    if (!window->model()) {
        std::cout.rdbuf(out);
        std::puts("refused save-failed");
        return 1;
    }
    window->show();
    if (!QTest::qWaitForWindowExposed(window.get()))
        problems << QStringLiteral("the window is not shown");
    FtpServerConfig &config = window->model()->config();
    const AppStrings &strings = AppStrings::instance();

    const auto expect = [&problems](bool holds, const QString &what) {
        if (!holds)
            problems << what;
        return holds;
    };
    // The user the table is to show (or no longer show) afterwards.
    QString shown = user;
    bool performed = false;
    if (operation == QLatin1String("vadd")) {
        answerer.setTyped({user, args[5]});
        performed = trigger(*window, "actionAdd_user", problems);
    } else if (operation == QLatin1String("vchange")) {
        shown = args[5];
        answerer.setTyped({shown, args[6]});
        performed = select(*window, user, problems) && trigger(*window, "actionEdit_user", problems);
    } else if (operation == QLatin1String("vdelete")) {
        performed = select(*window, user, problems) && trigger(*window, "actionDelete_user", problems);
    } else if (operation == QLatin1String("options")) {
        answerer.setOptions(options);
        performed = trigger(*window, "actionOptions", problems) && answerer.optionsAccepted()
            && expect(window->model()->hasUnsavedChanges(), QStringLiteral("the accepted options are not to be saved"));
    } else {
        performed = chooseStatus(*window, user, operation == QLatin1String("grant") ? strings.allowed : strings.denied,
                                 problems);
    }

    answerer.setSaving(true);
    const bool saved = performed && trigger(*window, "actionSave", problems) && !answerer.saveRefused()
        && !window->model()->hasUnsavedChanges();
    answerer.setSaving(false);

    // What the table and the engine hold once saved.
    bool done = performed;
    if (performed && virtualEdit) {
        const bool kept = operation != QLatin1String("vdelete");
        done = expect(rowOf(*window, shown, TreeModel::UsersColumn).isValid() == kept,
                      QStringLiteral("the table %1 %2")
                          .arg(kept ? QStringLiteral("lacks") : QStringLiteral("still shows"), shown))
            && expect(config.isVirtualUser(shown.toUtf8()) == kept,
                      QStringLiteral("%1 is %2 a virtual user")
                          .arg(shown, kept ? QStringLiteral("not") : QStringLiteral("still")));
        if (shown != user)
            done = expect(!config.isVirtualUser(user.toUtf8()), user + QStringLiteral(" is still a virtual user"))
                && done;
    } else if (performed && operation != QLatin1String("options")) {
        const QString status = operation == QLatin1String("grant") ? strings.allowed : strings.denied;
        const QString cell = rowOf(*window, user, TreeModel::StatusColumn).data().toString();
        done = expect(cell == status, QStringLiteral("the status of %1 reads \"%2\"").arg(user, cell))
            && expect(config.checkAccess(user.toUtf8(), false) == (status == strings.allowed),
                      QStringLiteral("the engine disagrees with the status of ") + user);
    }
    window.reset();
    std::cout.rdbuf(out);

    // The one expectation left is the answerer's, armed for a next box.
    modal.done();
    const QStringList left = modal.report().split(QLatin1Char('\n'), Qt::SkipEmptyParts);
    problems << answerer.problems();
    for (const QString &line : left) {
        if (!line.startsWith(QLatin1String("never came up")))
            problems << line;
    }
    for (const QString &problem : problems)
        std::fprintf(stderr, "problem: %s\n", qPrintable(problem));
    done = done && problems.isEmpty();
    std::printf("%s %s\n", done ? "done" : "refused", saved ? "saved" : "save-failed");
    return done && saved ? 0 : 1;
}
