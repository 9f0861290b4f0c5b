// Rights, per-user files and roots of FtpServerConfig.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"

#include "common/AppStrings.h"
#include "common/SafeFile.h"

#include <QCoreApplication>
#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <iostream>
#include <sys/stat.h>

namespace {

const char CreatedComment[] = "# File was created by FTP manager\n";

// The rights words in display order, untranslated and translated.
struct Right
{
    const char *word;
    QString AppStrings::*translated;
};
const Right Rights[] = {
    {"full access", &AppStrings::fullAccess}, {"write", &AppStrings::write}, {"download", &AppStrings::download},
    {"upload", &AppStrings::upload},          {"mkdir", &AppStrings::mkdir},
};

} // namespace

QString rightsText(const QStringList &rights)
{
    const AppStrings &strings = AppStrings::instance();
    QStringList shown;
    for (const Right &right : Rights) {
        if (rights.contains(QLatin1String(right.word)))
            shown << strings.*right.translated;
    }
    return shown.join(QStringLiteral(", "));
}

QString permissionLetters(unsigned flags)
{
    static const char letters[] = "rwx";
    QString out;
    for (int shift = 6; shift >= 0; shift -= 3) {
        for (int bit = 0; bit < 3; ++bit)
            out += (flags >> (shift + 2 - bit)) & 1 ? QLatin1Char(letters[bit]) : QLatin1Char('-');
    }
    return out;
}

ConfigFile *FtpServerConfig::rightsTarget(const QByteArray &user)
{
    return isAnonymousUser(user) ? &m_main : userConfig(user);
}

QStringList FtpServerConfig::userRights(const QByteArray &user) const
{
    const ConfigFile *own = isAnonymousUser(user) ? nullptr : userConfig(user);
    // A per-user file overrides the main configuration, which overrides the
    // server's defaults.
    const auto yes = [&](const auto &key, bool serverDefault) {
        if (own) {
            if (const auto data = findData(own->elements, "", key))
                return QByteArray::fromStdString(data->value).toLower() == "yes";
        }
        return isYes(key, serverDefault);
    };
    // The inverse of setUserRights, so that what the table shows is what
    // it writes back (whether the server lets a session use a right is the
    // forecast's business).
    const bool anonymousWrites = isAnonymousUser(user) || isYes("guest_enable");
    const bool writeEnabled = yes("write_enable", false);
    const bool write = writeEnabled && (!anonymousWrites || yes("anon_other_write_enable", false));
    const bool download = yes("download_enable", true);
    const bool upload = yes("anon_upload_enable", false);
    const bool mkdir = writeEnabled && (!anonymousWrites || yes("anon_mkdir_write_enable", false));
    if (write && download && upload && mkdir)
        return {QStringLiteral("full access")};
    QStringList rights;
    if (write)
        rights << QStringLiteral("write");
    if (download)
        rights << QStringLiteral("download");
    if (upload)
        rights << QStringLiteral("upload");
    if (mkdir)
        rights << QStringLiteral("mkdir");
    return rights;
}

bool FtpServerConfig::createUserConfig(const QByteArray &user)
{
    const QByteArray path = m_userConfigDir + user;
    if (const auto reason = invalidNameReason(user)) {
        std::cerr << "Unable to open " << path.constData() << std::endl;
        m_interaction.critical(QString(),
                               tr("Unable to create per-user config file.") + QLatin1Char('\n')
                                   + tr("\"%1\" cannot be a file name: %2.").arg(text(user), *reason));
        std::cout << "File " << path.constData() << " is not created." << std::endl;
        return false;
    }
    auto document = std::make_shared<ConfigFile>(SyntaxMode::KeyValue);
    document->parseText(CreatedComment);
    if (m_mode == Mode::ReadOnly) {
        // Held in memory only, so that a plan of the save shows it as the
        // new file it would be.
        m_userConfigs[user] = document;
        return true;
    }
    const QString file = resolved(path);
    QDir().mkpath(QFileInfo(file).absolutePath());
    if (writeFile(file, CreatedComment)) {
        std::cerr << "Unable to open " << path.constData() << std::endl;
        m_interaction.critical(QString(), tr("Unable to create per-user config file."));
        std::cout << "File " << path.constData() << " is not created." << std::endl;
        return false;
    }
    m_userConfigs[user] = document;
    m_createdFiles.insert(text(path));
    // On disk already: a save writes it again only once it is changed.
    remember(text(path), *document);
    return true;
}

bool FtpServerConfig::setUserRights(const QByteArray &user, const QString &rights)
{
    const AppStrings &strings = AppStrings::instance();
    const QStringList parts = rights.split(QStringLiteral(", "));
    const auto has = [&](const QString &word) { return parts.contains(word); };
    const bool full = has(strings.fullAccess);

    if (!isAnonymousUser(user) && !userConfig(user) && !createUserConfig(user)) {
        std::cout << "Unable to create userconf file" << std::endl;
        return false;
    }
    ConfigFile *target = rightsTarget(user);
    std::cout << "Set permissions: " << rights.toLocal8Bit().constData() << " for user " << user.constData()
              << std::endl;
    const bool anonymousKeys = isYes("guest_enable") || isAnonymousUser(user);
    const auto set = [&](const char *key, bool value) { setValue(target->elements, "", key, value ? "yes" : "no"); };

    if (full || has(strings.write)) {
        set("write_enable", true);
        if (anonymousKeys)
            set("anon_other_write_enable", true);
    } else {
        set("write_enable", false);
        // The anonymous write keys mean nothing to a local user's session.
        if (anonymousKeys)
            set("anon_other_write_enable", false);
    }
    set("download_enable", full || has(strings.download));
    set("anon_upload_enable", full || has(strings.upload));
    if (full || has(strings.mkdir)) {
        if (anonymousKeys)
            set("anon_mkdir_write_enable", true);
        // Deliberately after the write row: "mkdir" alone turns writing on.
        set("write_enable", true);
    } else if (anonymousKeys) {
        set("anon_mkdir_write_enable", false);
    }
    m_modified = true;
    return true;
}

bool FtpServerConfig::setUserRoot(const QByteArray &user, const QByteArray &directory)
{
    if (isAnonymousUser(user)) {
        setValue(m_main.elements, "", "anon_root", directory.toStdString());
    } else {
        if (!userConfig(user) && !createUserConfig(user))
            return false;
        setValue(userConfig(user)->elements, "", "local_root", directory.toStdString());
    }
    m_modified = true;
    return true;
}

void FtpServerConfig::setChrooted(const QByteArray &user)
{
    AccountRecord record;
    if (isYes("guest_enable") || !m_accounts || !m_accounts->getUserInfo(user, record) || isChrooted(user))
        return;
    const QString name = text(user);
    const bool local = isYes("chroot_local_user");
    if (isYes("chroot_list_enable")) {
        if (local)
            m_chrootList.removeAll(name);
        else
            m_chrootList.append(name);
    } else {
        // Neither confines the user yet: the list, enabled, does.
        setValue(m_main.elements, "", "chroot_list_enable", "yes");
        m_chrootList.append(name);
    }
    m_chrootListModified = m_modified = true;
}
