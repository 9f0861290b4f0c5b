#include "COptionsDialog.h"

#include "app/VexIcon.h"
#include "app/VexIntegration.h"
#include "common/AppStrings.h"
#include "dialogs/ComboBoxes.h"
#include "policy/FtpServerConfig.h"
#include "ui_COptionsDialog.h"

#include <QDir>
#include <QFile>
#include <QFileDialog>
#include <QFileInfo>
#include <QHostAddress>
#include <QInputDialog>
#include <QKeyEvent>
#include <QMessageBox>
#include <QNetworkInterface>
#include <QPushButton>
#include <QRegularExpression>
#include <QScrollBar>
#include <QSettings>
#include <QTextDocument>

#include <algorithm>
#include <cstdlib>

#include <locale.h>

namespace {

const QString splitterStateKey = QStringLiteral("COptionsDialog/splitterState");

enum SideFileIndex { BannerFile, EmailFile, ChrootFile, MessageFile };

// The listener choice: which of listen (IPv4) and listen_ipv6 say yes.
enum Listener { ListenNone = 0, ListenIpv4 = 1, ListenIpv6 = 2, ListenBoth = 3 };

// As vsftpd reads a boolean; anything else it refuses to start with.
bool meansYes(const QByteArray &value)
{
    const QByteArray upper = value.toUpper();
    return upper == "YES" || upper == "TRUE" || upper == "1";
}

QByteArray yesNo(bool yes)
{
    return yes ? QByteArrayLiteral("YES") : QByteArrayLiteral("NO");
}

// The file holds bytes per second, the dialog megabytes per second. The
// text is read as strtod reads it, whatever the operator's locale; a tiny
// limit shows as 0.01 rather than as unlimited.
double rateShown(const QByteArray &text)
{
    static const locale_t cLocale = newlocale(LC_ALL_MASK, "C", locale_t(nullptr));
    const double megabytes = strtod_l(text.constData(), nullptr, cLocale) * 9.5367431640625e-07;
    if (!(megabytes > 0))
        return 0;
    return std::max(megabytes, 0.01);
}

// Whole kilobytes, so the stored rate is a multiple of 1024.
QByteArray rateText(double megabytes)
{
    const auto kilobytes = static_cast<unsigned long long>(megabytes * 1024.0);
    return QByteArray::number(kilobytes << 10);
}

// vsftpd reads numbers with atoi: the leading digits count.
int leadingInteger(const QByteArray &text, int minimum, int maximum)
{
    const long long number = std::strtoll(text.constData(), nullptr, 10);
    return int(std::clamp<long long>(number, minimum, maximum));
}

bool hasControlCharacter(const QByteArray &text)
{
    for (const char c : text) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f)
            return true;
    }
    return false;
}

QIcon resourceIcon(const QString &name)
{
    return QIcon(QStringLiteral(":/prefix/icons/") + name);
}

QStringList itemTexts(const QListWidget *list)
{
    QStringList texts;
    for (int row = 0; row < list->count(); ++row)
        texts.append(list->item(row)->text());
    return texts;
}

// One line of the list per entry; blank lines name nothing, as the engine
// reads its lists.
QByteArray listContent(const QStringList &lines)
{
    QByteArray content;
    for (const QString &line : lines)
        content += line.toUtf8() + '\n';
    return content;
}

QByteArray withFinalNewline(QByteArray text)
{
    if (!text.isEmpty() && !text.endsWith('\n'))
        text += '\n';
    return text;
}

} // namespace

COptionsDialog::COptionsDialog(FtpServerConfig &config, QWidget *parent)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::COptionsDialog>())
    , m_config(config)
{
    m_ui->setupUi(this);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::accepted, this, &COptionsDialog::accept);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::rejected, this, &COptionsDialog::reject);

    for (const QString &title : AppStrings::instance().optionPageTitles)
        new QListWidgetItem(resourceIcon(QStringLiteral("option_item.png")), title, m_ui->pagesListWidget);
    m_ui->pagesListWidget->setCurrentRow(0);
    m_ui->pagesStackedWidget->setCurrentIndex(0);
    connect(m_ui->pagesListWidget, &QListWidget::clicked, this, &COptionsDialog::switchPage);
    // The keyboard moves through the list as well as the mouse.
    connect(m_ui->pagesListWidget, &QListWidget::currentRowChanged, m_ui->pagesStackedWidget,
            &QStackedWidget::setCurrentIndex);

    m_ui->moveLeftToolButton->setIcon(
        VexIcon::fromTheme(QStringLiteral("go-previous"), QString(), resourceIcon(QStringLiteral("move_left.png"))));
    m_ui->moveRightToolButton->setIcon(
        VexIcon::fromTheme(QStringLiteral("go-next"), QString(), resourceIcon(QStringLiteral("move_right.png"))));

    m_ui->listenerComboBox->addItem(tr("IPv4"), int(ListenIpv4));
    m_ui->listenerComboBox->addItem(tr("IPv6 (and IPv4 where the system maps it)"), int(ListenIpv6));
    m_ui->listenerComboBox->addItem(tr("IPv4 and IPv6 (vsftpd refuses to start)"), int(ListenBoth));
    m_ui->listenerComboBox->addItem(tr("Nothing (started by inetd)"), int(ListenNone));
    fillAddresses();

    QStringList accounts;
    for (const auto &entry : m_config.accounts().accounts())
        accounts.append(QString::fromUtf8(entry.first));
    for (QComboBox *combo : {m_ui->guestUsernameComboBox, m_ui->ftpUsernameComboBox, m_ui->chownUsernameComboBox})
        combo->addItems(accounts);

    m_sideFiles = {
        {m_ui->bannerFileLineEdit, QByteArray(), nullptr, m_ui->bannerFileTextEdit, QString()},
        {m_ui->bannedEmailFileLineEdit, "/etc/vsftpd.banned_emails", m_ui->emailsListWidget, nullptr,
         QStringLiteral("email.png")},
        {m_ui->chrootListFileLineEdit, "/etc/vsftpd.chroot_list", m_ui->chrootUsersListWidget, nullptr,
         QStringLiteral("user_green.png")},
        {m_ui->messageFileLineEdit, ".message", nullptr, m_ui->messageFileTextEdit, QString()},
    };
    bindKeys();
    connectEditors();

    // Every page title readable, however the splitter was left.
    QListWidget *pages = m_ui->pagesListWidget;
    pages->setMinimumWidth(pages->sizeHintForColumn(0) + 2 * pages->frameWidth()
                           + pages->verticalScrollBar()->sizeHint().width());
    vexRestoreGeometry(this);
    const QByteArray splitterState = QSettings().value(splitterStateKey).toByteArray();
    if (splitterState.isEmpty() || !m_ui->pagesSplitter->restoreState(splitterState))
        m_ui->pagesSplitter->setSizes({pages->minimumWidth(), width()});
    m_ui->pagesSplitter->setStretchFactor(1, 1);
}

COptionsDialog::~COptionsDialog() = default;

void COptionsDialog::fillAddresses()
{
    const QString all = AppStrings::instance().allInterfaces;
    m_ui->listenAddressComboBox->addItem(all);
    m_ui->listenAddress6ComboBox->addItem(all);
    for (const QHostAddress &address : QNetworkInterface::allAddresses()) {
        if (address.protocol() == QAbstractSocket::IPv4Protocol)
            m_ui->listenAddressComboBox->addItem(address.toString());
        // A link-local address needs its interface, which vsftpd's
        // listen_address6 cannot name.
        else if (address.protocol() == QAbstractSocket::IPv6Protocol && !address.isLinkLocal())
            m_ui->listenAddress6ComboBox->addItem(address.toString());
    }
}

void COptionsDialog::bindKeys()
{
    Ui::COptionsDialog &ui = *m_ui;
    const auto check = [](QCheckBox *box) -> Binding {
        return {{},
                {},
                [box](const QByteArray &value) { box->setChecked(meansYes(value)); },
                [box] { return yesNo(box->isChecked()); },
                nullptr};
    };
    const auto group = [](QGroupBox *box) -> Binding {
        return {{},
                {},
                [box](const QByteArray &value) { box->setChecked(meansYes(value)); },
                [box] { return yesNo(box->isChecked()); },
                nullptr};
    };
    const auto text = [](QLineEdit *edit) -> Binding {
        return {{},
                {},
                [edit](const QByteArray &value) { edit->setText(QString::fromUtf8(value)); },
                [edit] { return edit->text().toUtf8(); },
                nullptr};
    };
    const auto octal = [text](QLineEdit *edit) -> Binding {
        Binding binding = text(edit);
        binding.check = [](const QByteArray &value, bool changed) -> std::optional<QString> {
            static const QRegularExpression digits(QStringLiteral("^[0-7]{1,5}$"));
            if (!changed || digits.match(QString::fromUtf8(value)).hasMatch())
                return std::nullopt;
            return tr("\"%1\" is not an octal number such as 022.").arg(QString::fromUtf8(value));
        };
        return binding;
    };
    const auto account = [](QComboBox *combo) -> Binding {
        return {{},
                {},
                [combo](const QByteArray &value) { selectOrAdd(combo, QString::fromUtf8(value)); },
                [combo] { return combo->currentText().toUtf8(); },
                nullptr};
    };
    const auto number = [](QSpinBox *spin) -> Binding {
        return {{},
                {},
                [spin](const QByteArray &value) {
                    spin->setValue(leadingInteger(value, spin->minimum(), spin->maximum()));
                },
                [spin] { return QByteArray::number(spin->value()); },
                // The spin box would quietly keep its last value for text
                // it cannot take.
                [spin](const QByteArray &, bool) -> std::optional<QString> {
                    if (spin->hasAcceptableInput())
                        return std::nullopt;
                    return tr("\"%1\" is not a number from %2 to %3.")
                        .arg(spin->text())
                        .arg(spin->minimum())
                        .arg(spin->maximum());
                }};
    };
    const auto rate = [](QDoubleSpinBox *spin) -> Binding {
        return {{},
                {},
                [spin](const QByteArray &value) {
                    spin->setMinimum(0);
                    spin->setValue(rateShown(value));
                },
                [spin] { return rateText(spin->value()); },
                nullptr};
    };
    // "0.0.0.0" (or nothing) is every interface; the IPv6 entry writes
    // "::", which vsftpd binds exactly as it binds without the key, so that
    // both address keys read and write alike.
    const auto address = [](QComboBox *combo, const QByteArray &any) -> Binding {
        return {{},
                {},
                [combo, any](const QByteArray &value) {
                    if (value.isEmpty() || value == any)
                        combo->setCurrentIndex(0);
                    else
                        selectOrAdd(combo, QString::fromUtf8(value));
                },
                [combo, any] { return combo->currentIndex() == 0 ? any : combo->currentText().toUtf8(); },
                nullptr};
    };
    const auto listener = [this] { return m_ui->listenerComboBox->currentData().toInt(); };
    const auto chrootState = [this] {
        const bool all = m_ui->chrootAllRadioButton->isChecked() || m_ui->chrootAllButListedRadioButton->isChecked();
        const bool list
            = m_ui->chrootListedRadioButton->isChecked() || m_ui->chrootAllButListedRadioButton->isChecked();
        return std::make_pair(all, list);
    };

    const auto bind = [this](const char *key, const char *defaultValue, Binding binding) {
        binding.key = key;
        binding.defaultValue = defaultValue;
        m_bindings.push_back(std::move(binding));
    };
    bind("guest_enable", "no", check(ui.guestEnableCheckBox));
    bind("guest_username", "ftp", account(ui.guestUsernameComboBox));
    bind("local_enable", "no", check(ui.localEnableCheckBox));
    bind("write_enable", "no", check(ui.writeEnableCheckBox));
    bind("allow_writeable_chroot", "no", check(ui.allowWriteableChrootCheckBox));
    bind("xferlog_enable", "no", check(ui.xferlogEnableCheckBox));
    bind("ftpd_banner", "", text(ui.ftpdBannerLineEdit));
    bind("banner_file", "", text(ui.bannerFileLineEdit));
    bind("cmds_allowed", "",
         {{},
          {},
          [this](const QByteArray &value) {
              m_ui->cmdsAllowedGroupBox->setChecked(!value.isEmpty());
              m_ui->commandsListWidget->clear();
              if (value.isEmpty())
                  return;
              for (const QByteArray &command : value.split(','))
                  new QListWidgetItem(resourceIcon(QStringLiteral("ftp_command.png")), QString::fromUtf8(command),
                                      m_ui->commandsListWidget);
          },
          [this] {
              // Unchecked, or with nothing listed, the key goes: vsftpd
              // reads an empty list as no restriction at all.
              if (!m_ui->cmdsAllowedGroupBox->isChecked())
                  return QByteArray();
              return itemTexts(m_ui->commandsListWidget).join(QLatin1Char(',')).toUtf8();
          },
          nullptr});
    bind("deny_file", "", text(ui.denyFileLineEdit));
    bind("hide_file", "", text(ui.hideFileLineEdit));
    bind("anonymous_enable", "yes", check(ui.anonymousEnableCheckBox));
    bind("anon_world_readable_only", "yes", check(ui.anonWorldReadableOnlyCheckBox));
    bind("no_anon_password", "no", check(ui.noAnonPasswordCheckBox));
    bind("anon_max_rate", "0", rate(ui.anonMaxRateDoubleSpinBox));
    bind("ftp_username", "ftp", account(ui.ftpUsernameComboBox));
    bind("anon_umask", "077", octal(ui.anonUmaskLineEdit));
    bind("chown_upload_mode", "0600", octal(ui.chownUploadModeLineEdit));
    bind("chown_username", "root", account(ui.chownUsernameComboBox));
    bind("banned_email_file", "/etc/vsftpd.banned_emails", text(ui.bannedEmailFileLineEdit));
    bind("deny_email_enable", "no", group(ui.denyEmailEnableGroupBox));
    bind("connect_from_port_20", "no", check(ui.connectFromPort20CheckBox));
    bind("pasv_enable", "yes", check(ui.pasvEnableCheckBox));
    bind("port_enable", "yes", check(ui.portEnableCheckBox));
    bind("session_support", "no", check(ui.sessionSupportCheckBox));
    bind("delay_failed_login", "1", number(ui.delayFailedLoginSpinBox));
    bind("delay_successful_login", "0", number(ui.delaySuccessfulLoginSpinBox));
    bind("idle_session_timeout", "300", number(ui.idleSessionTimeoutSpinBox));
    bind("ftp_data_port", "20", number(ui.ftpDataPortSpinBox));
    bind("listen_port", "21", number(ui.listenPortSpinBox));
    bind("max_clients", "0", number(ui.maxClientsSpinBox));
    bind("max_per_ip", "0", number(ui.maxPerIpSpinBox));
    // Every pair the file can hold is an entry, even the one vsftpd
    // refuses, so that an untouched choice writes back what it read.
    bind("listen", "no",
         {{},
          {},
          [this](const QByteArray &value) { m_loadedListen = meansYes(value); },
          [listener] { return yesNo(listener() & ListenIpv4); },
          nullptr});
    bind("listen_ipv6", "no",
         {{},
          {},
          [this](const QByteArray &value) {
              const int state = (m_loadedListen ? ListenIpv4 : 0) | (meansYes(value) ? ListenIpv6 : 0);
              m_ui->listenerComboBox->setCurrentIndex(m_ui->listenerComboBox->findData(state));
          },
          [listener] { return yesNo(listener() & ListenIpv6); },
          nullptr});
    bind("listen_address", "", address(ui.listenAddressComboBox, "0.0.0.0"));
    bind("listen_address6", "", address(ui.listenAddress6ComboBox, "::"));
    bind("download_enable", "yes", check(ui.downloadEnableCheckBox));
    bind("ascii_download_enable", "no", check(ui.asciiDownloadEnableCheckBox));
    bind("ascii_upload_enable", "no", check(ui.asciiUploadEnableCheckBox));
    bind("async_abor_enable", "no", check(ui.asyncAborEnableCheckBox));
    bind("chown_uploads", "no", check(ui.chownUploadsCheckBox));
    bind("delete_failed_uploads", "no", check(ui.deleteFailedUploadsCheckBox));
    bind("log_ftp_protocol", "no", check(ui.logFtpProtocolCheckBox));
    bind("ls_recurse_enable", "no", check(ui.lsRecurseEnableCheckBox));
    bind("mdtm_write", "yes", check(ui.mdtmWriteCheckBox));
    bind("use_localtime", "no", check(ui.useLocaltimeCheckBox));
    bind("local_max_rate", "0", rate(ui.localMaxRateDoubleSpinBox));
    bind("local_umask", "077", octal(ui.localUmaskLineEdit));
    // Four states, so that every pair of the two keys reads back as it was:
    // nobody, everybody, only the listed users, everybody but them.
    bind("chroot_list_enable", "no",
         {{},
          {},
          [this](const QByteArray &value) { m_loadedChrootListEnable = meansYes(value); },
          [chrootState] { return yesNo(chrootState().second); },
          nullptr});
    bind("chroot_local_user", "no",
         {{},
          {},
          [this](const QByteArray &value) {
              const bool all = meansYes(value);
              QRadioButton *state = m_loadedChrootListEnable
                  ? (all ? m_ui->chrootAllButListedRadioButton : m_ui->chrootListedRadioButton)
                  : (all ? m_ui->chrootAllRadioButton : m_ui->chrootNobodyRadioButton);
              state->setChecked(true);
          },
          [chrootState] { return yesNo(chrootState().first); },
          nullptr});
    bind("chroot_list_file", "/etc/vsftpd.chroot_list", text(ui.chrootListFileLineEdit));
    bind("chmod_enable", "yes", check(ui.chmodEnableCheckBox));
    bind("dirlist_enable", "yes", check(ui.dirlistEnableCheckBox));
    bind("dirmessage_enable", "no", check(ui.dirmessageEnableCheckBox));
    bind("dual_log_enable", "no", check(ui.dualLogEnableCheckBox));
    bind("force_dot_files", "no", check(ui.forceDotFilesCheckBox));
    bind("hide_ids", "no", check(ui.hideIdsCheckBox));
    bind("message_file", ".message", text(ui.messageFileLineEdit));
}

void COptionsDialog::connectEditors()
{
    Ui::COptionsDialog &ui = *m_ui;
    connect(ui.addCommandPushButton, &QPushButton::clicked, this, &COptionsDialog::addNewCommandListElement);
    connect(ui.deleteCommandPushButton, &QPushButton::clicked, this, &COptionsDialog::deleteCommandListElement);
    connect(ui.addEmailPushButton, &QPushButton::clicked, this, &COptionsDialog::addNewEmailListElement);
    connect(ui.deleteEmailPushButton, &QPushButton::clicked, this, &COptionsDialog::deleteEmailListElement);
    connect(ui.bannedEmailFileToolButton, &QToolButton::clicked, this, &COptionsDialog::selectMaillistFile);
    connect(ui.messageFileToolButton, &QToolButton::clicked, this, &COptionsDialog::selectPerDirectoryMessageFile);
    connect(ui.bannerFileToolButton, &QToolButton::clicked, this, &COptionsDialog::setupMessageListPath);
    connect(ui.chrootListFileToolButton, &QToolButton::clicked, this, &COptionsDialog::setupChrootUserListPath);
    connect(ui.moveRightToolButton, &QToolButton::clicked, this, &COptionsDialog::addUserToChrootList);
    connect(ui.moveLeftToolButton, &QToolButton::clicked, this, &COptionsDialog::excludeUserFromChrootList);

    // Return in a file name loads that file; it must not accept the dialog.
    for (const SideFile &file : m_sideFiles) {
        file.pathEdit->installEventFilter(this);
        // Only a file with an absolute name is one file; a relative one
        // (".message") is looked up in each directory.
        QWidget *editor = file.list ? static_cast<QWidget *>(file.list) : file.textEdit;
        const QByteArray defaultPath = file.defaultPath;
        const auto follow = [editor, defaultPath](const QString &path) {
            const bool oneFile = QDir::isAbsolutePath(path.isEmpty() ? QString::fromUtf8(defaultPath) : path);
            editor->setEnabled(oneFile);
            if (auto *text = qobject_cast<QPlainTextEdit *>(editor))
                text->setPlaceholderText(oneFile ? QString()
                                                 : tr("A relative name is looked up in each directory; give an "
                                                      "absolute path to edit the file here."));
        };
        connect(file.pathEdit, &QLineEdit::textChanged, editor, follow);
        follow(file.pathEdit->text());
    }

    // Each governed widget follows its box from now on, starting now.
    const auto governs = [this](QAbstractButton *box, std::initializer_list<QWidget *> widgets) {
        for (QWidget *widget : widgets) {
            connect(box, &QAbstractButton::toggled, widget, &QWidget::setEnabled);
            widget->setEnabled(box->isChecked());
        }
    };
    governs(ui.guestEnableCheckBox, {ui.guestUsernameLabel, ui.guestUsernameComboBox});
    governs(ui.anonymousEnableCheckBox, {ui.anonymousGroupBox});
    governs(ui.connectFromPort20CheckBox, {ui.ftpDataPortLabel, ui.ftpDataPortSpinBox});
    governs(ui.dirmessageEnableCheckBox, {ui.messageFileLabel, ui.messageFileLineEdit, ui.messageFileToolButton});
    const auto followListener = [this] {
        const int state = m_ui->listenerComboBox->currentData().toInt();
        m_ui->listenAddressComboBox->setEnabled(state & ListenIpv4);
        m_ui->listenAddress6ComboBox->setEnabled(state & ListenIpv6);
    };
    connect(ui.listenerComboBox, QOverload<int>::of(&QComboBox::currentIndexChanged), this, followListener);
    followListener();
    for (QRadioButton *radio : {ui.chrootNobodyRadioButton, ui.chrootAllRadioButton, ui.chrootListedRadioButton,
                                ui.chrootAllButListedRadioButton})
        connect(radio, &QRadioButton::toggled, this, &COptionsDialog::updateChrootLists);
}

void COptionsDialog::load()
{
    for (const Binding &binding : m_bindings)
        binding.show(m_config.value(binding.key, binding.defaultValue));
    // After every key: the combined choices show once both halves are read.
    for (const Binding &binding : m_bindings)
        m_shown[binding.key] = binding.text();

    loadSideFile(m_sideFiles[BannerFile]);
    loadSideFile(m_sideFiles[EmailFile]);
    loadChrootLists();
    loadSideFile(m_sideFiles[MessageFile]);
    updateChrootLists();
    updateButtons();
}

void COptionsDialog::save()
{
    for (const Binding &binding : m_bindings) {
        const QByteArray text = binding.text();
        if (text == m_shown.value(binding.key))
            continue;
        // An emptied value goes: vsftpd reads an empty one as no value,
        // and the key's default then holds as it does when it is absent.
        if (text.isEmpty())
            m_config.removeOption(binding.key);
        else
            m_config.setOption(binding.key, text);
        m_shown[binding.key] = text;
    }
    const SideFile &chroot = m_sideFiles[ChrootFile];
    const QByteArray path = sidePath(chroot);
    if (QDir::isAbsolutePath(QString::fromUtf8(path)))
        m_config.setChrootList(path, itemTexts(chroot.list));
}

void COptionsDialog::accept()
{
    // Nothing is written while any value is refused.
    for (const Binding &binding : m_bindings) {
        const QByteArray text = binding.text();
        const bool changed = text != m_shown.value(binding.key);
        std::optional<QString> refusal;
        if (changed && hasControlCharacter(text))
            refusal = tr("Line breaks and control characters cannot be stored.");
        else if (binding.check)
            refusal = binding.check(text, changed);
        if (refusal) {
            warn(QString::fromLatin1(binding.key) + QStringLiteral(": ") + *refusal);
            return;
        }
    }
    if (!writeSideFiles())
        return;
    QDialog::accept();
}

void COptionsDialog::done(int result)
{
    QSettings().setValue(splitterStateKey, m_ui->pagesSplitter->saveState());
    vexSaveGeometry(this);
    QDialog::done(result);
}

bool COptionsDialog::eventFilter(QObject *watched, QEvent *event)
{
    if (event->type() == QEvent::KeyPress) {
        const int key = static_cast<QKeyEvent *>(event)->key();
        if (key == Qt::Key_Return || key == Qt::Key_Enter) {
            for (const SideFile &file : m_sideFiles) {
                if (file.pathEdit != watched)
                    continue;
                if (file.pathEdit == m_ui->chrootListFileLineEdit)
                    loadChrootLists();
                else
                    loadSideFile(file);
                updateButtons();
                return true;
            }
        }
    }
    return QDialog::eventFilter(watched, event);
}

// Lists and files ------------------------------------------------------------

QByteArray COptionsDialog::sidePath(const SideFile &file) const
{
    const QByteArray path = file.pathEdit->text().toUtf8();
    return path.isEmpty() ? file.defaultPath : path;
}

QStringList COptionsDialog::editorLines(const SideFile &file) const
{
    if (file.list)
        return itemTexts(file.list);
    return {file.textEdit->toPlainText()};
}

QStringList COptionsDialog::fileLines(const SideFile &file) const
{
    const QString path = QString::fromUtf8(sidePath(file));
    const QStringList nothing = file.list ? QStringList() : QStringList{QString()};
    if (!QDir::isAbsolutePath(path))
        return nothing;
    QFile in(m_config.root().resolve(path));
    if (!in.open(QIODevice::ReadOnly))
        return nothing;
    if (!file.list) {
        // As the editor shows it (line ends, the last one), so that a
        // file shown and not edited compares equal.
        QByteArray content = in.readAll();
        if (content.endsWith('\n'))
            content.chop(1);
        QTextDocument shown;
        shown.setPlainText(QString::fromUtf8(content));
        return {shown.toPlainText()};
    }
    QStringList lines;
    while (!in.atEnd()) {
        const QString line = QString::fromUtf8(in.readLine()).simplified();
        if (!line.isEmpty())
            lines.append(line);
    }
    return lines;
}

void COptionsDialog::loadSideFile(const SideFile &file)
{
    const QStringList lines = fileLines(file);
    if (file.list) {
        file.list->clear();
        for (const QString &line : lines)
            new QListWidgetItem(resourceIcon(file.icon), line, file.list);
        return;
    }
    file.textEdit->setPlainText(lines.value(0));
}

void COptionsDialog::loadChrootLists()
{
    const SideFile &file = m_sideFiles[ChrootFile];
    // The list in memory may hold changes of the table not yet saved.
    const QStringList listed
        = sidePath(file) == m_config.chrootListPath() ? m_config.chrootList().names() : fileLines(file);
    file.list->clear();
    m_ui->usersListWidget->clear();
    const QIcon icon = resourceIcon(file.icon);
    for (const QString &name : listed)
        new QListWidgetItem(icon, name, file.list);
    for (const auto &entry : m_config.accounts().accounts()) {
        const QString name = QString::fromUtf8(entry.first);
        if (!listed.contains(name))
            new QListWidgetItem(icon, name, m_ui->usersListWidget);
    }
}

bool COptionsDialog::writeSideFiles()
{
    for (const SideFile &file : m_sideFiles) {
        const QByteArray path = sidePath(file);
        if (!QDir::isAbsolutePath(QString::fromUtf8(path)))
            continue;
        const QStringList lines = editorLines(file);
        // A file that holds this already stays as it is; a missing one
        // with nothing to hold is not made.
        if (lines == fileLines(file))
            continue;
        const QByteArray content = file.list ? listContent(lines) : withFinalNewline(lines.value(0).toUtf8());
        if (const auto error = m_config.writeSideFile(path, content)) {
            QMessageBox::critical(this, windowTitle(),
                                  tr("Unable to write %1: %2").arg(QString::fromUtf8(path), *error));
            return false;
        }
    }
    return true;
}

void COptionsDialog::updateButtons()
{
    m_ui->deleteCommandPushButton->setEnabled(m_ui->commandsListWidget->count() > 0);
    m_ui->deleteEmailPushButton->setEnabled(m_ui->emailsListWidget->count() > 0);
    m_ui->moveRightToolButton->setEnabled(m_ui->usersListWidget->count() > 0);
    m_ui->moveLeftToolButton->setEnabled(m_ui->chrootUsersListWidget->count() > 0);
}

void COptionsDialog::updateChrootLists()
{
    m_ui->chrootListGroupBox->setEnabled(m_ui->chrootListedRadioButton->isChecked()
                                         || m_ui->chrootAllButListedRadioButton->isChecked());
}

void COptionsDialog::warn(const QString &text)
{
    QMessageBox::warning(this, tr("Warning!"), text);
}

void COptionsDialog::addListEntry(const QString &label, QListWidget *list, const QString &icon,
                                  const std::function<std::optional<QString>(const QString &)> &refusal)
{
    bool ok = false;
    const QString entry = QInputDialog::getText(this, windowTitle(), label, QLineEdit::Normal, {}, &ok);
    if (!ok || entry.isEmpty())
        return;
    if (const auto why = refusal(entry)) {
        warn(*why);
        return;
    }
    // An entry listed twice allows or bans nothing more: the second is
    // dropped without a word.
    if (!list->findItems(entry, Qt::MatchExactly).isEmpty())
        return;
    new QListWidgetItem(resourceIcon(icon), entry, list);
    updateButtons();
}

void COptionsDialog::deleteCurrent(QListWidget *list)
{
    delete list->takeItem(list->currentRow());
    updateButtons();
}

void COptionsDialog::addNewCommandListElement()
{
    addListEntry(tr("Enter allowed FTP command:"), m_ui->commandsListWidget, QStringLiteral("ftp_command.png"),
                 [](const QString &command) -> std::optional<QString> {
                     // The list is one line of names split at commas.
                     static const QRegularExpression separators(QStringLiteral("[,\\s[:cntrl:]]"));
                     if (command.contains(separators))
                         return tr("Bad command name: %1").arg(command);
                     return std::nullopt;
                 });
}

void COptionsDialog::deleteCommandListElement()
{
    deleteCurrent(m_ui->commandsListWidget);
}

void COptionsDialog::addNewEmailListElement()
{
    addListEntry(tr("Enter email address:"), m_ui->emailsListWidget, QStringLiteral("email.png"),
                 [](const QString &address) -> std::optional<QString> {
                     static const QRegularExpression pattern(
                         QRegularExpression::anchoredPattern(QStringLiteral("\\b[^\\s@]+@[^\\s@]+\\.[^\\s@]+\\b")));
                     if (!pattern.match(address).hasMatch())
                         return tr("Bad email address: %1").arg(address);
                     return std::nullopt;
                 });
}

void COptionsDialog::deleteEmailListElement()
{
    deleteCurrent(m_ui->emailsListWidget);
}

QString COptionsDialog::choosePath(const QString &title, const QString &startDirectory, const QString &filter)
{
    const QString chosen = QFileDialog::getOpenFileName(this, title, startDirectory, filter);
    // The dialog shows the real file system; the configuration names paths
    // as the administrator knows them, inside the root.
    const RootDirectory &root = m_config.root();
    if (!chosen.isEmpty() && !root.isSystemRoot() && chosen.startsWith(root.path() + QLatin1Char('/')))
        return chosen.mid(root.path().size());
    return chosen;
}

namespace {

QString directoryOf(const RootDirectory &root, const QString &path)
{
    return QFileInfo(root.resolve(path)).absolutePath();
}

} // namespace

void COptionsDialog::selectMaillistFile()
{
    const SideFile &file = m_sideFiles[EmailFile];
    const QString chosen = choosePath(tr("Select file with e-mail addresses"),
                                      directoryOf(m_config.root(), QString::fromUtf8(sidePath(file))));
    if (chosen.isEmpty())
        return;
    file.pathEdit->setText(chosen);
    loadSideFile(file);
    updateButtons();
}

void COptionsDialog::selectPerDirectoryMessageFile()
{
    const SideFile &file = m_sideFiles[MessageFile];
    const QString chosen = choosePath(tr("Select per-directory message file"),
                                      directoryOf(m_config.root(), QString::fromUtf8(sidePath(file))));
    if (chosen.isEmpty())
        return;
    file.pathEdit->setText(chosen);
    loadSideFile(file);
}

void COptionsDialog::setupMessageListPath()
{
    const QString chosen = choosePath(tr("Point to file"), QString::fromLocal8Bit(qgetenv("PWD")), tr("All files (*)"));
    if (chosen.isEmpty())
        return;
    m_ui->bannerFileLineEdit->setText(chosen);
    reloadMessageFile();
}

void COptionsDialog::setupChrootUserListPath()
{
    const QString chosen = choosePath(tr("Point to file"), QString::fromLocal8Bit(qgetenv("PWD")), tr("All files (*)"));
    if (chosen.isEmpty())
        return;
    m_ui->chrootListFileLineEdit->setText(chosen);
    loadChrootLists();
    updateButtons();
}

void COptionsDialog::reloadMessageFile()
{
    m_ui->bannerFileTextEdit->clear();
    loadSideFile(m_sideFiles[BannerFile]);
}

void COptionsDialog::moveSelected(QListWidget *from, QListWidget *to)
{
    for (QListWidgetItem *item : from->selectedItems())
        to->addItem(from->takeItem(from->row(item)));
    updateButtons();
}

void COptionsDialog::addUserToChrootList()
{
    moveSelected(m_ui->usersListWidget, m_ui->chrootUsersListWidget);
}

void COptionsDialog::excludeUserFromChrootList()
{
    moveSelected(m_ui->chrootUsersListWidget, m_ui->usersListWidget);
}

void COptionsDialog::switchPage(const QModelIndex &index)
{
    m_ui->pagesStackedWidget->setCurrentIndex(index.row());
}
