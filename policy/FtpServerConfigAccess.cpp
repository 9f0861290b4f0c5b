// The access checks of FtpServerConfig, their repairs, and blocking through the userlist.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"

#include "common/AppStrings.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <iostream>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

bool FtpServerConfig::checkAccess(const QByteArray &user, bool repair, AccessFailure *failure)
{
    using Check = bool (FtpServerConfig::*)(const QByteArray &, bool, AccessFailure *);
    static const Check checks[] = {
        &FtpServerConfig::checkMainConfig, &FtpServerConfig::checkReserved, &FtpServerConfig::checkRootDirectory,
        &FtpServerConfig::checkFtpusers,   &FtpServerConfig::checkUserlist, &FtpServerConfig::checkPassword,
    };
    // A repair may create what the pass saw missing and change values: it
    // reads afresh, and what was read before it is forgotten.
    std::unique_ptr<PassCache> pass;
    if (repair && m_pass)
        pass = std::exchange(m_pass, nullptr);
    struct Restore
    {
        FtpServerConfig &config;
        std::unique_ptr<PassCache> &pass;
        ~Restore()
        {
            if (pass)
                config.m_pass = std::make_unique<PassCache>();
        }
    } restore{*this, pass};
    for (const Check check : checks) {
        if (!(this->*check)(user, repair, failure))
            return false;
    }
    return checkPamUserdb(user, repair, failure);
}

bool FtpServerConfig::checkMainConfig(const QByteArray &user, bool repair, AccessFailure *failure)
{
    if (isAnonymousUser(user)) {
        const auto anonymous = mainValue("anonymous_enable");
        // The server's own default admits anonymous users.
        if (!anonymous || anonymous->compare("yes", Qt::CaseInsensitive) == 0)
            return true;
        if (repair) {
            findData(m_main.elements, "", "anonymous_enable")->value = "yes";
            m_modified = true;
            return true;
        }
        return refuse(failure, FailureKind::MainConfig, refusal("main ftp config has anonymous_enable option != yes."));
    }

    const auto local = mainValue("local_enable");
    if (local && local->compare("yes", Qt::CaseInsensitive) != 0) {
        if (!repair)
            return refuse(failure, FailureKind::MainConfig, refusal("main ftp config has local_enable != yes"));
        findData(m_main.elements, "", "local_enable")->value = "yes";
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
    // Made only for a refusal: most users pass.
    const auto shown = [&directory] { return text(directory); };
    std::optional<struct stat> info;
    if (!directory.isEmpty())
        info = pathStatus(directory);
    if (!info || !S_ISDIR(info->st_mode)) {
        if (repair) {
            Interaction::Question question;
            question.message
                = {Interaction::Icon::Question, QString(), tr("User home directory %1 does not exist.").arg(shown()),
                   tr("Do you want to create it?"), QString()};
            question.buttons = {Interaction::Button::Accept, Interaction::Button::Cancel};
            question.acceptText = tr("Create");
            if (m_interaction.ask(question) == Interaction::Button::Accept) {
                if (!createRootDirectory(user, directory, failure))
                    return false;
            } else {
                return refuse(failure, FailureKind::Filesystem,
                              refusal("user home directory %1 does not exist.").arg(shown()));
            }
        } else {
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 does not exist.").arg(shown()));
        }
    }
    if (!isAnonymousUser(user))
        return true;

    const QByteArray account = ftpAccountName(user);
    const QString onDisk = resolved(directory);
    // Read again: a repair above may have created it.
    info = fileStatus(onDisk);
    if (!info)
        return refuse(failure, FailureKind::Filesystem, refusal("user home directory %1 does not exist.").arg(shown()));
    AccountRecord anonymous;
    const bool haveAccount = m_accounts && m_accounts->getUserInfo(account, anonymous);
    if (haveAccount && info->st_uid == anonymous.uid) {
        std::optional<QString> owner;
        if (repair) {
            QStringList names;
            for (const auto &entry : m_accounts->accounts())
                names.append(text(entry.first));
            owner = m_interaction.chooseOwner(names);
        }
        if (!owner || owner->isEmpty()) {
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 is owned by anonymous user %2.").arg(shown(), text(account)));
        }
        AccountRecord chosen;
        if (!m_accounts->getUserInfo(owner->toUtf8(), chosen)
            || (m_mode == Mode::ReadWrite
                && ::chown(QFile::encodeName(onDisk).constData(), chosen.uid, static_cast<gid_t>(-1)) != 0)) {
            m_interaction.show({Interaction::Icon::Critical, QString(), tr("Unable to change root directory owner."),
                                tr("Unable to change ftp root owner"), QString()});
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 is owned by anonymous user %2.").arg(shown(), text(account)));
        }
    }

    QByteArray groupName;
    if (m_accounts) {
        const auto group = m_accounts->groups().find(info->st_gid);
        if (group != m_accounts->groups().end())
            groupName = group->second.name;
    }
    if ((info->st_mode & S_IWGRP) && !groupName.isEmpty() && m_accounts->isUserInGroup(account, groupName)) {
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
                fixed = m_mode == Mode::ReadOnly
                    || ::chmod(QFile::encodeName(absolute).constData(), info->st_mode & 07777 & ~S_IWGRP) == 0;
            }
        }
        if (!fixed) {
            // "%2" twice: the group fills both, the account finds no place.
            return refuse(failure, FailureKind::Filesystem,
                          refusal("user home directory %1 is writable by group %2, in which anonymous user %2 "
                                  "participates in.")
                              // Both %2 name the group: the account has no place in the text.
                              .arg(shown(), text(groupName)));
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
    const auto name = [&user] { return text(user); };
    switch (userlistMode()) {
    case UserlistMode::Off:
        return true;
    case UserlistMode::Deny:
        if (!m_userlist.contains(user))
            return true;
        if (!repair) {
            return refuse(failure, FailureKind::UserlistFile,
                          refusal("userlist file contains %1, userlist file mode = black users").arg(name()));
        }
        m_userlist.removeAll(name());
        m_userlistModified = m_modified = true;
        return true;
    case UserlistMode::Allow:
        if (m_userlist.contains(user))
            return true;
        if (!repair) {
            return refuse(failure, FailureKind::UserlistFile,
                          refusal("userlist file doesn't contains %1, userlist file mode = white users").arg(name()));
        }
        m_userlist.append(name());
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
    // Denied twice (an editor committed again), the name is still listed once.
    if (!m_userlist.contains(text(user)))
        m_userlist.append(text(user));
    setValue(m_main.elements, "", "userlist_file", str(path));
    m_userlistModified = m_modified = true;
}

bool FtpServerConfig::ftpusersListed(const QByteArray &name)
{
    if (!m_ftpusersIndexValid) {
        m_ftpusersIndex.clear();
        for (const auto &element : m_ftpusers.elements) {
            if (element->type() != ElementType::Expr)
                continue;
            for (const auto &token : std::static_pointer_cast<ConfigElementExpr>(element)->tokens) {
                // pam_listfile drops a "\r" before the line end: "bob\r" lists bob.
                QByteArray name = QByteArray::fromStdString(token.text);
                if (name.endsWith('\r'))
                    name.chop(1);
                m_ftpusersIndex.insert(name);
            }
        }
        m_ftpusersIndexValid = true;
    }
    return m_ftpusersIndex.contains(name);
}

void showFailureDialog(Interaction &interaction, const AccessFailure &failure)
{
    interaction.show(
        {Interaction::Icon::Critical, QString(), failure.message,
         QCoreApplication::translate("FtpServerConfig", "Failure classification: ") + failureKindText(failure.kind),
         QString()});
}
