#include "FtpServerConfig.h"

#include "policy/AppStrings.h"
#include "policy/SafeFile.h"

#include <QCoreApplication>
#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QSettings>

#include <fstream>
#include <iostream>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

#ifndef FTPCONFIG_MULTIARCH
#define FTPCONFIG_MULTIARCH ""
#endif

namespace {

QString tr(const char *text)
{
    return QCoreApplication::translate("FtpServerConfig", text);
}

// Refusal messages are built untranslated: administrators search for them.
QString refusal(const char *text)
{
    return QStringLiteral("***Result: FALSE. Check: ") + QLatin1String(text);
}

bool refuse(AccessFailure *failure, FailureKind kind, const QString &message)
{
    if (failure) {
        failure->kind = kind;
        failure->message = message;
    }
    return false;
}

QString text(const QByteArray &bytes)
{
    return QString::fromUtf8(bytes);
}

std::string str(const QByteArray &bytes)
{
    return bytes.toStdString();
}

const QByteArray DefaultListDirectory = "/etc/vsftpd.d/";

} // namespace

FtpServerConfig::FtpServerConfig(Interaction &interaction, const RootDirectory &root, Mode mode)
    : m_interaction(interaction)
    , m_root(root)
    , m_mode(mode)
{
}

FtpServerConfig::~FtpServerConfig() = default;

QByteArray FtpServerConfig::pamUserdbModule()
{
    const QByteArray multiarch = FTPCONFIG_MULTIARCH;
    return multiarch.isEmpty() ? QByteArray("/lib/security/pam_userdb.so")
                               : "/lib/" + multiarch + "/security/pam_userdb.so";
}

QString FtpServerConfig::resolved(const QByteArray &path) const
{
    return m_root.resolve(QFile::decodeName(path));
}

// Loading ---------------------------------------------------------------

void FtpServerConfig::load()
{
    loadMainConfig();
    loadPamConfig();
    const QByteArray db = QByteArray::fromStdString(moduleArgument(m_pam.elements, "pam_userdb.so", "db"));
    if (db.isEmpty()) {
        const AppStrings &strings = AppStrings::instance();
        m_dbPath = QFile::encodeName(strings.stateDirectory + QLatin1Char('/') + strings.virtualUsersDbName);
    } else {
        m_dbPath = db.endsWith(".db") ? db : db + ".db";
    }
    loadUserlist();
    loadFtpusers();
    loadChrootList();
    loadUserConfigs();
    // Read-only, the document stays as the file is: the forecast judges
    // the file the server reads.
    if (m_mode == Mode::ReadWrite && !findData(m_main.elements, "", "listen")
        && !findData(m_main.elements, "", "listen_ipv6"))
        setValue(m_main.elements, "", "listen", "yes");
    loadVirtualUsers();
}

void FtpServerConfig::loadMainConfig()
{
    const QString path = AppStrings::instance().mainConfigPath;
    const QString file = m_root.resolve(path);
    const std::string shown = QFile::encodeName(path).toStdString();
    if (!QFileInfo::exists(file)) {
        m_mainConfigExisted = false;
        std::cout << shown << " not found" << std::endl;
        if (m_mode == Mode::ReadOnly) {
            m_main.parseText("listen=YES\n");
            return;
        }
        QFile created(file);
        if (!created.open(QIODevice::WriteOnly) || created.write("listen=YES\n") != 11) {
            m_interaction.critical(tr("Initialization error"), tr("Unable to create %1").arg(path));
            m_interaction.exitProcess(-1);
        }
    }
    std::ifstream in(QFile::encodeName(file).toStdString(), std::ios::in | std::ios::binary);
    if (!in.is_open() || QFileInfo(file).isDir()) {
        std::cout << shown << " could not be opened" << std::endl;
        m_interaction.critical(tr("Initialization error"), tr("Unable to open %1").arg(path));
        m_interaction.exitProcess(-1);
    }
    m_main.parse(in);
    remember(path, m_main);
}

void FtpServerConfig::loadPamConfig()
{
    m_pamServiceName = value("pam_service_name", "vsftpd");
    const QString path = AppStrings::instance().pamDirectory + text(m_pamServiceName);
    const QString file = m_root.resolve(path);
    if (!QFileInfo(file).isFile()) {
        std::cout << QFile::encodeName(path).constData() << " not found" << std::endl;
        m_interaction.critical(tr("Initialization error"), tr("Unable to find %1").arg(path));
        m_interaction.exitProcess(-1);
    }
    std::ifstream in(QFile::encodeName(file).toStdString(), std::ios::in | std::ios::binary);
    m_pam.parse(in);
    remember(path, m_pam);
}

QStringList FtpServerConfig::readNameList(const QByteArray &path) const
{
    QStringList names;
    QFile file(resolved(path));
    if (!file.open(QIODevice::ReadOnly))
        return names;
    while (!file.atEnd()) {
        const QString name = QString::fromUtf8(file.readLine()).simplified();
        // An empty line names nobody; dropping it keeps the list's meaning.
        if (!name.isEmpty())
            names.append(name);
    }
    return names;
}

void FtpServerConfig::loadUserlist()
{
    m_userlistPath = configuredUserlistPath();
    m_userlist = NameList(readNameList(m_userlistPath));
    m_loadedText[text(m_userlistPath)] = nameListContent(m_userlist, m_userlistPath).toStdString();
}

void FtpServerConfig::loadFtpusers()
{
    const auto line = findModuleLine(m_pam.elements, "pam_listfile.so");
    if (!line)
        return;
    FtpusersRule rule;
    rule.item = QByteArray::fromStdString(tokenArgument(*line, "item"));
    rule.sense = QByteArray::fromStdString(tokenArgument(*line, "sense"));
    rule.file = QByteArray::fromStdString(tokenArgument(*line, "file"));
    rule.onerr = QByteArray::fromStdString(tokenArgument(*line, "onerr"));
    rule.apply = QByteArray::fromStdString(tokenArgument(*line, "apply"));
    m_ftpusersRule = rule;
    std::ifstream in(QFile::encodeName(resolved(rule.file)).toStdString(), std::ios::in | std::ios::binary);
    if (in.is_open()) {
        m_ftpusers.parse(in);
        remember(text(rule.file), m_ftpusers);
    }
}

void FtpServerConfig::loadChrootList()
{
    m_chrootListPath = configuredChrootListPath();
    m_chrootList = NameList(readNameList(m_chrootListPath));
    m_loadedText[text(m_chrootListPath)] = nameListContent(m_chrootList, m_chrootListPath).toStdString();
}

void FtpServerConfig::loadUserConfigs()
{
    m_userConfigDir = value("user_config_dir", DefaultListDirectory + "users.d/");
    if (!m_userConfigDir.endsWith('/'))
        m_userConfigDir += '/';
    const QString directory = resolved(m_userConfigDir);
    if (!QFileInfo(directory).isDir()) {
        if (m_mode == Mode::ReadWrite)
            QDir().mkpath(directory);
        return;
    }
    const QStringList names = QDir(directory).entryList(QDir::Files | QDir::Hidden, QDir::Name);
    for (const QString &name : names) {
        // Hidden files are editor backups or what an interrupted save left;
        // vsftpd looks a file up by the user's name, which is never such.
        if (invalidNameReason(QFile::encodeName(name)))
            continue;
        const QString file = QDir(directory).filePath(name);
        std::ifstream in(QFile::encodeName(file).toStdString(), std::ios::in | std::ios::binary);
        if (!in.is_open()) {
            std::cerr << "Unable to open " << (m_userConfigDir + QFile::encodeName(name)).constData() << std::endl;
            continue;
        }
        auto document = std::make_shared<ConfigFile>(SyntaxMode::KeyValue);
        document->parse(in);
        m_userConfigs.emplace(QFile::encodeName(name), document);
        remember(text(m_userConfigDir) + name, *document);
    }
}

void FtpServerConfig::loadVirtualUsers()
{
    const auto access = m_mode == Mode::ReadOnly ? AccountStore::Access::ReadOnly : AccountStore::Access::ReadWrite;
    m_accounts = std::make_unique<AccountStore>(QByteArray(), m_root, access);
    try {
        m_accounts->loadVirtualUsers(m_dbPath);
    } catch (const std::exception &e) {
        m_interaction.critical(tr("Error in creating database"),
                               tr("Unable lo load or create virtual user database.\nError message: ")
                                   + QString::fromLocal8Bit(e.what()));
    }
}

// Settings -----------------------------------------------------------------

QByteArray FtpServerConfig::configuredUserlistPath() const
{
    // Deliberately the program's own file, not the server's default.
    return value("userlist_file", DefaultListDirectory + "allowed_user_list.conf");
}

QByteArray FtpServerConfig::configuredChrootListPath() const
{
    return value("chroot_list_file", "/etc/vsftpd.chroot_list");
}

QByteArray FtpServerConfig::value(const QByteArray &key, const QByteArray &defaultValue) const
{
    const auto data = findData(m_main.elements, "", str(key));
    return data ? QByteArray::fromStdString(data->value) : defaultValue;
}

bool FtpServerConfig::isYes(const QByteArray &key, bool absentMeansYes) const
{
    return value(key, absentMeansYes ? "yes" : "no").toLower() == "yes";
}

void FtpServerConfig::setYes(const QByteArray &key)
{
    setValue(m_main.elements, "", str(key), "yes");
    m_modified = true;
}

// Users ------------------------------------------------------------------

bool FtpServerConfig::isAnonymousUser(const QByteArray &user) const
{
    const AppStrings &strings = AppStrings::instance();
    return user == strings.anonymousUsers.toLocal8Bit() || user == strings.anonymousWord.toLocal8Bit() || user == "ftp";
}

bool FtpServerConfig::isVirtualUser(const QByteArray &user) const
{
    return m_accounts && m_accounts->isVirtualUser(user);
}

FtpServerConfig::UserlistMode FtpServerConfig::userlistMode() const
{
    if (value("userlist_enable", "yes").toLower() == "no")
        return UserlistMode::Off;
    return isYes("userlist_deny", true) ? UserlistMode::Deny : UserlistMode::Allow;
}

bool FtpServerConfig::isChrooted(const QByteArray &user) const
{
    if (isYes("guest_enable"))
        return true;
    AccountRecord record;
    if (!m_accounts || !m_accounts->getUserInfo(user, record))
        return true;
    const bool local = isYes("chroot_local_user");
    if (!isYes("chroot_list_enable"))
        return local;
    const bool listed = m_chrootList.contains(text(user));
    return local ? !listed : listed;
}

QByteArray FtpServerConfig::effectiveRoot(const QByteArray &user) const
{
    if (!isChrooted(user))
        return "/";
    if (const ConfigFile *own = userConfig(user)) {
        if (const auto localRoot = findData(own->elements, "", "local_root"))
            return QByteArray::fromStdString(localRoot->value);
    }
    const auto homeOf = [this](const QByteArray &account) {
        AccountRecord record;
        return m_accounts && m_accounts->getUserInfo(account, record) ? record.home : QByteArray();
    };
    if (isAnonymousUser(user)) {
        if (const auto anonRoot = findData(m_main.elements, "", "anon_root"))
            return QByteArray::fromStdString(anonRoot->value);
        return homeOf(value("guest_username", "ftp"));
    }
    if (const auto localRoot = findData(m_main.elements, "", "local_root"))
        return QByteArray::fromStdString(localRoot->value);
    if (isVirtualUser(user) && isYes("guest_enable"))
        return homeOf(value("guest_username", "ftp"));
    return homeOf(user);
}

QByteArray FtpServerConfig::ftpAccountName(const QByteArray &user) const
{
    if (isAnonymousUser(user))
        return value("ftp_username", "ftp");
    if (isVirtualUser(user))
        return value("guest_username", "ftp");
    return user;
}

// Access evaluation --------------------------------------------------------

bool FtpServerConfig::checkAccess(const QByteArray &user, bool repair, AccessFailure *failure)
{
    using Check = bool (FtpServerConfig::*)(const QByteArray &, bool, AccessFailure *);
    static const Check checks[] = {
        &FtpServerConfig::checkMainConfig, &FtpServerConfig::checkReserved, &FtpServerConfig::checkRootDirectory,
        &FtpServerConfig::checkFtpusers,   &FtpServerConfig::checkUserlist, &FtpServerConfig::checkPassword,
    };
    for (const Check check : checks) {
        if (!(this->*check)(user, repair, failure))
            return false;
    }
    return checkPamUserdb(user, repair, failure);
}

bool FtpServerConfig::checkMainConfig(const QByteArray &user, bool repair, AccessFailure *failure)
{
    if (isAnonymousUser(user)) {
        const auto anonymous = findData(m_main.elements, "", "anonymous_enable");
        // The server's own default admits anonymous users.
        if (!anonymous || QByteArray::fromStdString(anonymous->value).toLower() == "yes")
            return true;
        if (repair) {
            anonymous->value = "yes";
            m_modified = true;
            return true;
        }
        return refuse(failure, FailureKind::MainConfig, refusal("main ftp config has anonymous_enable option != yes."));
    }

    const auto local = findData(m_main.elements, "", "local_enable");
    if (local && QByteArray::fromStdString(local->value).toLower() != "yes") {
        if (!repair)
            return refuse(failure, FailureKind::MainConfig, refusal("main ftp config has local_enable != yes"));
        local->value = "yes";
        m_modified = true;
    } else if (!local) {
        if (!repair)
            return refuse(failure, FailureKind::MainConfig, refusal("main ftp config has no local_enable defined"));
        appendData(m_main.elements, "local_enable", "yes");
        m_modified = true;
    }

    if (isVirtualUser(user) && !isYes("guest_enable")) {
        if (!repair) {
            return refuse(failure, FailureKind::MainConfig,
                          refusal("user is virtual, but in main ftp config guest users are not enabled (but have "
                                  "to be)."));
        }
        setYes("guest_enable");
    }
    return true;
}

bool FtpServerConfig::checkReserved(const QByteArray &, bool, AccessFailure *)
{
    return true;
}

bool FtpServerConfig::checkRootDirectory(const QByteArray &user, bool repair, AccessFailure *failure)
{
    const QByteArray directory = effectiveRoot(user);
    const QString shown = text(directory);
    const QString onDisk = resolved(directory);
    if (directory.isEmpty() || !QFileInfo(onDisk).isDir()) {
        if (repair) {
            Interaction::Question question;
            question.message
                = {Interaction::Icon::Question, QString(), tr("User home directory %1 does not exist.").arg(shown),
                   tr("Do you want to create it?"), QString()};
            question.buttons = {Interaction::Button::Accept, Interaction::Button::Cancel};
            question.acceptText = tr("Create");
            if (m_interaction.ask(question) == Interaction::Button::Accept) {
                if (!createRootDirectory(user, directory, failure))
                    return false;
            } else {
                return refuse(failure, FailureKind::Filesystem,
                              refusal("user home directory %1 does not exist.").arg(shown));
            }
        } else {
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 does not exist.").arg(shown));
        }
    }
    if (!isAnonymousUser(user))
        return true;

    const QByteArray account = ftpAccountName(user);
    struct stat info
    {
    };
    if (::stat(QFile::encodeName(onDisk).constData(), &info) != 0)
        return refuse(failure, FailureKind::Filesystem, refusal("user home directory %1 does not exist.").arg(shown));
    AccountRecord anonymous;
    const bool haveAccount = m_accounts && m_accounts->getUserInfo(account, anonymous);
    if (haveAccount && info.st_uid == anonymous.uid) {
        std::optional<QString> owner;
        if (repair) {
            QStringList names;
            for (const auto &entry : m_accounts->accounts())
                names.append(text(entry.first));
            owner = m_interaction.chooseOwner(names);
        }
        if (!owner || owner->isEmpty()) {
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 is owned by anonymous user %2.").arg(shown, text(account)));
        }
        AccountRecord chosen;
        if (!m_accounts->getUserInfo(owner->toUtf8(), chosen)
            || ::chown(QFile::encodeName(onDisk).constData(), chosen.uid, static_cast<gid_t>(-1)) != 0) {
            m_interaction.show({Interaction::Icon::Critical, QString(), tr("Unable to change root directory owner."),
                                tr("Unable to change ftp root owner"), QString()});
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 is owned by anonymous user %2.").arg(shown, text(account)));
        }
    }

    QByteArray groupName;
    if (m_accounts) {
        const auto group = m_accounts->groups().find(info.st_gid);
        if (group != m_accounts->groups().end())
            groupName = group->second.name;
    }
    if ((info.st_mode & S_IWGRP) && !groupName.isEmpty() && m_accounts->isUserInGroup(account, groupName)) {
        bool fixed = false;
        if (repair) {
            Interaction::Question question;
            question.message = {Interaction::Icon::Question, tr("Invalid group of FTP root folder"),
                                tr("FTP root folder is writeable by group it belongs - it is forbidden. Do you allow "
                                   "to change directory permissions?"),
                                QString(), QString()};
            question.buttons = {Interaction::Button::Yes, Interaction::Button::No};
            question.defaultButton = Interaction::Button::Yes;
            if (m_interaction.ask(question) == Interaction::Button::Yes) {
                const QString absolute = QFileInfo(onDisk).absoluteFilePath();
                fixed = ::chmod(QFile::encodeName(absolute).constData(), info.st_mode & 07777 & ~S_IWGRP) == 0;
            }
        }
        if (!fixed) {
            // "%2" twice: the group fills both, the account finds no place.
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 is writable by group %2, in which anonymous user %2 "
                                  "participates in.")
                              .arg(shown, text(groupName), text(account)));
        }
    }
    return true;
}

bool FtpServerConfig::checkFtpusers(const QByteArray &user, bool repair, AccessFailure *failure)
{
    if (!m_ftpusersRule)
        return true;
    const FtpusersRule &rule = *m_ftpusersRule;
    const bool allow = rule.sense == "allow";
    if (rule.item == "group") {
        const QList<QByteArray> groups = m_accounts ? m_accounts->userGroups(user) : QList<QByteArray>();
        bool listed = false;
        for (const QByteArray &group : groups)
            listed = listed || ftpusersListed(group);
        if (allow) {
            if (listed)
                return true;
            if (!repair) {
                return refuse(failure, FailureKind::FtpusersFile,
                              refusal("ftpusers file (item:group, sense:allow) has no group, in which participates "
                                      "user %1")
                                  .arg(text(user)));
            }
            if (groups.isEmpty()) {
                std::cerr << "Unable to detect group of user " << user.constData() << std::endl;
            } else {
                insertTokenLine(m_ftpusers.elements, {str(groups.first())}, InsertAt::End);
                m_ftpusersModified = m_modified = true;
                m_ftpusersIndexValid = false;
            }
            return true;
        }
        if (!listed)
            return true;
        if (!repair) {
            return refuse(failure, FailureKind::FtpusersFile,
                          refusal("ftpusers file (item:group, sense:deny) contains group, in which participates user  "
                                  "%1")
                              .arg(text(user)));
        }
        for (const QByteArray &group : groups)
            removeTokenEverywhere(m_ftpusers.elements, str(group));
        m_ftpusersModified = m_modified = true;
        m_ftpusersIndexValid = false;
        return true;
    }
    if (rule.item != "user" && rule.item != "ruser")
        return true;

    const bool listed = ftpusersListed(user);
    if (!allow) {
        if (!listed)
            return true;
        if (!repair) {
            return refuse(failure, FailureKind::FtpusersFile,
                          refusal("ftpusers file (item:user|ruser, sense:deny) contains  %1 record.").arg(text(user)));
        }
        removeTokenEverywhere(m_ftpusers.elements, str(user));
        m_ftpusersModified = m_modified = true;
        m_ftpusersIndexValid = false;
        return true;
    }
    if (listed)
        return true;
    if (!repair) {
        return refuse(failure, FailureKind::FtpusersFile,
                      refusal("ftpusers file (item:user|ruser, sense:allow) has no %1 record.").arg(text(user)));
    }
    insertTokenLine(m_ftpusers.elements, {str(user)}, InsertAt::End);
    m_ftpusersModified = m_modified = true;
    m_ftpusersIndexValid = false;
    return true;
}

bool FtpServerConfig::checkUserlist(const QByteArray &user, bool repair, AccessFailure *failure)
{
    const QString name = text(user);
    switch (userlistMode()) {
    case UserlistMode::Off:
        return true;
    case UserlistMode::Deny:
        if (!m_userlist.contains(name))
            return true;
        if (!repair) {
            return refuse(failure, FailureKind::UserlistFile,
                          refusal("userlist file contains %1, userlist file mode = black users").arg(name));
        }
        m_userlist.removeAll(name);
        m_userlistModified = m_modified = true;
        return true;
    case UserlistMode::Allow:
        if (m_userlist.contains(name))
            return true;
        if (!repair) {
            return refuse(failure, FailureKind::UserlistFile,
                          refusal("userlist file doesn't contains %1, userlist file mode = white users").arg(name));
        }
        m_userlist.append(name);
        m_userlistModified = m_modified = true;
        return true;
    }
    return true;
}

bool FtpServerConfig::checkPassword(const QByteArray &user, bool, AccessFailure *failure)
{
    if (isAnonymousUser(user) || isVirtualUser(user))
        return true;
    AccountRecord record;
    if (!m_accounts || !m_accounts->getUserInfo(user, record)) {
        return refuse(failure, FailureKind::PasswdShadow,
                      refusal("user %1 could not be found in local user db.").arg(text(user)));
    }
    const AppStrings &strings = AppStrings::instance();
    if (record.password == "!" || record.password == "*") {
        return refuse(failure, FailureKind::PasswdShadow,
                      refusal("user %1  has bad passwd in %2 (* or !).").arg(text(user), strings.passwdPath));
    }
    const QByteArray shadow = m_accounts->shadowPassword(user);
    if (shadow == "!" || shadow == "*") {
        return refuse(failure, FailureKind::PasswdShadow,
                      refusal("user %1  has bad passwd in %2 (* or !).").arg(text(user), strings.shadowPath));
    }
    return true;
}

// PAM virtual-user integration ----------------------------------------------

bool FtpServerConfig::ensureDirectoryOf(const QString &path)
{
    const QString directory = QFileInfo(path).absolutePath();
    if (QDir().mkpath(m_root.resolve(directory)))
        return true;
    m_interaction.critical(tr("Error creating directory"),
                           tr("Unable to create directory %1. Virtual users database will not be created.\n That "
                              "means, that virtual users will not work.")
                               .arg(directory));
    return false;
}

bool FtpServerConfig::checkPamUserdb(const QByteArray &user, bool interactive, AccessFailure *failure)
{
    // Read once: the table asks for every virtual user.
    if (!m_skipPamCheck)
        m_skipPamCheck = QSettings().value(QStringLiteral("skip_pam_check"), false).toBool();
    if (*m_skipPamCheck)
        return true;
    if (!isVirtualUser(user))
        return true;
    if (m_pam.elements.empty()) {
        std::cerr << "Invalid db path" << std::endl;
        return true;
    }

    int handled = 0;
    for (const auto &element : m_pam.elements) {
        if (element->type() != ElementType::Expr)
            continue;
        auto line = std::static_pointer_cast<ConfigElementExpr>(element);
        if (line->tokens.empty())
            continue;
        auto token = line->tokens.begin();
        if (token->text != "auth" && token->text != "account")
            continue;
        ++token;
        const bool sufficient = token != line->tokens.end() && token->text == "sufficient";
        const auto module = sufficient ? std::next(token) : line->tokens.end();
        const auto endsWith = [](const std::string &s, const std::string &suffix) {
            return s.size() >= suffix.size() && s.compare(s.size() - suffix.size(), suffix.size(), suffix) == 0;
        };
        // A module token of 12 characters or fewer passes without the test.
        if (!sufficient || module == line->tokens.end()
            || (module->text.size() >= 13 && !endsWith(module->text, "pam_userdb.so"))) {
            const Interaction::PamChoice choice = m_interaction.askPamProblem();
            if (choice == Interaction::PamChoice::Skip)
                return false;
            if (choice == Interaction::PamChoice::Valid) {
                QSettings().setValue(QStringLiteral("skip_pam_check"), true);
                m_skipPamCheck = true;
                return true;
            }
            return fixPamUserdb();
        }

        for (auto argument = std::next(module); argument != line->tokens.end(); ++argument) {
            if (argument->text.compare(0, 3, "db=") != 0)
                continue;
            QByteArray path = QByteArray::fromStdString(argument->text.substr(3));
            if (!path.isEmpty() && !path.endsWith(".db"))
                path += ".db";
            if (QFileInfo::exists(resolved(path)))
                continue;
            if (!interactive) {
                refuse(failure, FailureKind::PamUserDb,
                       refusal("in vsftpd PAM file module pam_userdb.so contains invalid path to virtual user db "
                               "file."));
                continue;
            }
            const QString label = tr("Virtual users database file defined in vsftpd PAM configuration is not found.")
                + QLatin1Char('\n')
                + tr("It means, that FTP config was unable to create the following db file: %1").arg(text(path))
                + QLatin1Char('\n') + tr("Please, define new db file path.");
            const std::optional<QString> entered = m_interaction.askPath(label, text(path));
            if (!entered)
                continue;
            if (!ensureDirectoryOf(*entered)) {
                m_interaction.critical(tr("Error"), tr("Can't create path to file:") + QLatin1Char('\n') + *entered);
                continue;
            }
            QString newPath = *entered;
            if (newPath.endsWith(QLatin1String(".db")))
                newPath.chop(3);
            argument->text = "db=" + newPath.toUtf8().toStdString();
            m_modified = true;
            m_interaction.inform(tr("Information"),
                                 tr("Please, restart FTP configurator.\nChanges you have "
                                    "performed will be used only after restart"));
        }
        if (++handled == 2)
            break;
    }
    if (handled == 0)
        std::cerr << "Invalid db path" << std::endl;
    return true;
}

bool FtpServerConfig::fixPamUserdb()
{
    QString initial = QString::fromStdString(moduleArgument(m_pam.elements, "pam_userdb.so", "db"));
    if (!initial.isEmpty() && !initial.endsWith(QLatin1String(".db")))
        initial += QLatin1String(".db");
    const std::optional<QString> entered
        = m_interaction.askPath(tr("Enter new virtual users database file path:"), initial);
    if (!entered)
        return false;
    if (!ensureDirectoryOf(*entered)) {
        m_interaction.critical(tr("Error"), tr("Can't create path to file:") + QLatin1Char('\n') + *entered);
        return false;
    }
    QString path = *entered;
    if (path.endsWith(QLatin1String(".db")))
        path.chop(3);
    const std::string module = str(pamUserdbModule());
    const std::string db = "db=" + path.toUtf8().toStdString();
    insertTokenLine(m_pam.elements, {"account", "sufficient", module, db}, InsertAt::Top);
    insertTokenLine(m_pam.elements, {"auth", "sufficient", module, db}, InsertAt::Top);
    m_modified = true;
    return true;
}

// Userlist and directories ----------------------------------------------

void FtpServerConfig::blockUserByUserlist(const QByteArray &user)
{
    setValue(m_main.elements, "", "userlist_enable", "yes");
    const QByteArray path = configuredUserlistPath();
    if (value("userlist_deny", "yes").toLower() != "yes") {
        Interaction::Question question;
        question.message
            = {Interaction::Icon::Warning, QString(),
               tr("Warning! Changing contents logic of file %1. Was: allowed. To be done: blocked.").arg(text(path)),
               tr("(Do you want to continue?"), QString()};
        question.buttons = {Interaction::Button::Yes, Interaction::Button::No};
        if (m_interaction.ask(question) != Interaction::Button::Yes)
            return;
        setValue(m_main.elements, "", "userlist_deny", "yes");
        // The names so far were the admitted users: kept, they would now be
        // the blocked ones.
        m_userlist.clear();
    }
    m_userlist.append(text(user));
    setValue(m_main.elements, "", "userlist_file", str(path));
    m_userlistModified = m_modified = true;
}

bool FtpServerConfig::createRootDirectory(const QByteArray &user, const QByteArray &directory, AccessFailure *failure)
{
    const QString shown = text(directory);
    const QString onDisk = resolved(directory);
    if (directory.isEmpty() || !QDir().mkpath(onDisk)) {
        return refuse(failure, FailureKind::Filesystem, refusal("Unable to create directory %1.").arg(shown));
    }
    const QByteArray account = ftpAccountName(user);
    AccountRecord record;
    const bool known = m_accounts && m_accounts->getUserInfo(account, record);
    const QList<QByteArray> groups = known ? m_accounts->userGroups(account) : QList<QByteArray>();
    gid_t gid = static_cast<gid_t>(-1);
    QByteArray groupName;
    if (groups.isEmpty()) {
        std::cout << "Error: user " << account.constData() << "has no group." << std::endl;
    } else {
        groupName = groups.last(); // the primary group comes last
        const int id = m_accounts->groupIdByName(groupName);
        if (id >= 0)
            gid = static_cast<gid_t>(id);
    }
    const QByteArray path = QFile::encodeName(onDisk);
    if (!known || ::chown(path.constData(), record.uid, gid) != 0) {
        m_interaction.critical(
            QString(),
            tr("Unable to change owner and group of %1 to %2, %3").arg(shown, text(account), text(groupName)));
    }
    // Read and write for owner and group; the anonymous root stays
    // read-only for its account unless anonymous users may write.
    mode_t mode = 0775;
    if (isAnonymousUser(user) && value("anon_other_write_enable", "no").toLower() != "yes")
        mode = 0555;
    if (::chmod(path.constData(), mode) != 0) {
        m_interaction.critical(QString(),
                               tr("Unable to change owner and group read-write permissions of %1").arg(shown));
    }
    return true;
}

// Accessors ----------------------------------------------------------------

ConfigFile &FtpServerConfig::mainConfig()
{
    return m_main;
}

bool FtpServerConfig::mainConfigExisted() const
{
    return m_mainConfigExisted;
}

ConfigFile &FtpServerConfig::pamConfig()
{
    return m_pam;
}

const QByteArray &FtpServerConfig::pamServiceName() const
{
    return m_pamServiceName;
}

const std::optional<FtpServerConfig::FtpusersRule> &FtpServerConfig::ftpusersRule() const
{
    return m_ftpusersRule;
}

ConfigFile &FtpServerConfig::ftpusersList()
{
    m_ftpusersIndexValid = false; // the caller may change it
    return m_ftpusers;
}

bool FtpServerConfig::ftpusersListed(const QByteArray &name)
{
    if (!m_ftpusersIndexValid) {
        m_ftpusersIndex.clear();
        for (const auto &element : m_ftpusers.elements) {
            if (element->type() != ElementType::Expr)
                continue;
            for (const auto &token : std::static_pointer_cast<ConfigElementExpr>(element)->tokens)
                m_ftpusersIndex.insert(QByteArray::fromStdString(token.text));
        }
        m_ftpusersIndexValid = true;
    }
    return m_ftpusersIndex.contains(name);
}

bool FtpServerConfig::ftpusersModified() const
{
    return m_ftpusersModified;
}

NameList &FtpServerConfig::userlist()
{
    return m_userlist;
}

const QByteArray &FtpServerConfig::userlistPath() const
{
    return m_userlistPath;
}

bool FtpServerConfig::userlistModified() const
{
    return m_userlistModified;
}

NameList &FtpServerConfig::chrootList()
{
    return m_chrootList;
}

const QByteArray &FtpServerConfig::chrootListPath() const
{
    return m_chrootListPath;
}

bool FtpServerConfig::chrootListModified() const
{
    return m_chrootListModified;
}

const QByteArray &FtpServerConfig::userConfigDir() const
{
    return m_userConfigDir;
}

std::map<QByteArray, std::shared_ptr<ConfigFile>> &FtpServerConfig::userConfigs()
{
    return m_userConfigs;
}

ConfigFile *FtpServerConfig::userConfig(const QByteArray &user) const
{
    const auto it = m_userConfigs.find(user);
    return it == m_userConfigs.end() ? nullptr : it->second.get();
}

const QByteArray &FtpServerConfig::virtualUsersDbPath() const
{
    return m_dbPath;
}

AccountStore &FtpServerConfig::accounts()
{
    return *m_accounts;
}

const AccountStore &FtpServerConfig::accounts() const
{
    return *m_accounts;
}

const RootDirectory &FtpServerConfig::root() const
{
    return m_root;
}

Interaction &FtpServerConfig::interaction()
{
    return m_interaction;
}

FtpServerConfig::Mode FtpServerConfig::mode() const
{
    return m_mode;
}

bool FtpServerConfig::isModified() const
{
    return m_modified;
}

void FtpServerConfig::setModified(bool modified)
{
    m_modified = modified;
}

void showFailureDialog(Interaction &interaction, const AccessFailure &failure)
{
    interaction.show(
        {Interaction::Icon::Critical, QString(), failure.message,
         QCoreApplication::translate("FtpServerConfig", "Failure classification: ") + failureKindText(failure.kind),
         QString()});
}
