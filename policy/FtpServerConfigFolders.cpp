// Root directories of FtpServerConfig: creation, ownership and permission bits.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"

#include "common/AppStrings.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <iostream>
#include <sys/stat.h>
#include <unistd.h>

bool FtpServerConfig::createRootDirectory(const QByteArray &user, const QByteArray &directory, AccessFailure *failure)
{
    const QString shown = text(directory);
    const QString onDisk = resolved(directory);
    // Read-only (a dry run of an edit) changes nothing on disk: the repair
    // counts as made, as it would be.
    if (m_mode == Mode::ReadOnly && !directory.isEmpty())
        return true;
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

void FtpServerConfig::checkFolderPermissions(const QByteArray &user, const QStringList &rights)
{
    checkFolderPermissions(user, rights, effectiveRoot(user));
}

void FtpServerConfig::checkFolderPermissions(const QByteArray &user, const QStringList &rights,
                                             const QByteArray &directory)
{
    const AppStrings &strings = AppStrings::instance();
    // A user who is not confined has "/" as its root: the session starts in
    // its home and the bits of "/" are not the user's business. Opening "/"
    // to everybody would be.
    if (directory == "/")
        return;
    const QString shown = text(directory);
    const QByteArray onDisk = QFile::encodeName(resolved(directory));
    struct stat info
    {
    };
    if (::stat(onDisk.constData(), &info) != 0)
        return;

    const QByteArray account = ftpAccountName(user);
    AccountRecord record;
    if (!m_accounts || !m_accounts->getUserInfo(account, record)) {
        m_interaction.critical(
            QString(), tr("Unable to get groups in which user participates in. Username: %1").arg(text(account)));
        return;
    }
    QByteArray ownerName = m_accounts->userNameById(info.st_uid);
    QByteArray groupName;
    const auto group = m_accounts->groups().find(info.st_gid);
    if (group != m_accounts->groups().end())
        groupName = group->second.name;
    if (ownerName.isEmpty())
        ownerName = QByteArray::number(info.st_uid);
    if (groupName.isEmpty())
        groupName = QByteArray::number(info.st_gid);

    // The permission class the session's account falls in.
    int shift = 0;
    if (info.st_uid == record.uid)
        shift = 6;
    else if (m_accounts->isUserInGroup(account, groupName))
        shift = 3;
    const mode_t readBit = S_IROTH << shift;
    const mode_t writeBit = S_IWOTH << shift;

    const bool full = rights.contains(strings.fullAccess) || rights.contains(QStringLiteral("full access"));
    const auto has = [&](const QString &translated, const char *word) {
        return full || rights.contains(translated) || rights.contains(QLatin1String(word));
    };
    const QString mapped
        = account != user ? tr("Detected mapped system user: %1").arg(text(account)) + QLatin1Char('\n') : QString();
    mode_t mode = info.st_mode & 07777;
    const auto askFix = [&](const QString &question, mode_t bit) {
        Interaction::Question box;
        box.message = {Interaction::Icon::Question, QString(), question.arg(text(account)), tr("Let me fix it?"),
                       mapped + tr("Folder owner: %1\nFolder group: %2\n").arg(text(ownerName), text(groupName))
                           + QLatin1Char('\n') + tr("Current permissions:\n") + permissionLetters(mode)
                           + QLatin1Char('\n') + tr("New permissions:\n") + permissionLetters(mode | bit)};
        box.buttons = {Interaction::Button::Yes, Interaction::Button::No};
        if (m_interaction.ask(box) == Interaction::Button::Yes)
            mode |= bit;
    };

    if (has(strings.download, "download") && !(mode & readBit))
        askFix(tr("User may download, but folder has no READ permission for user %1"), readBit);
    const bool writes = has(strings.write, "write") || has(strings.upload, "upload") || has(strings.mkdir, "mkdir");
    if (writes && !(mode & writeBit)) {
        if (isAnonymousUser(user))
            m_interaction.warn(QString(), tr("Root folder for anonymous user must be read-only by him."));
        else if (!isYes("guest_enable"))
            askFix(tr("User may write, but folder has no WRITE permission for user %1"), writeBit);
    }
    if (mode != (info.st_mode & 07777) && m_mode == Mode::ReadWrite && ::chmod(onDisk.constData(), mode) != 0)
        m_interaction.critical(QString(), tr("Unable to change permissions of folder %1").arg(shown));
}

void FtpServerConfig::offerChroot(const QByteArray &user, const QByteArray &directory)
{
    if (isChrooted(user))
        return;
    Interaction::Question question;
    question.message = {Interaction::Icon::Question, QString(),
                        tr("This user is not chroot'ed to his home folder.\nDo you want to restrict access "
                           "outside given folder: %1")
                            .arg(QString::fromLocal8Bit(directory)),
                        QString(), QString()};
    question.buttons = {Interaction::Button::Yes, Interaction::Button::No};
    if (m_interaction.ask(question) == Interaction::Button::Yes)
        setChrooted(user);
}
