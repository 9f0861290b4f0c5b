// Saving of FtpServerConfig: every store written back through one writer.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"

#include "common/AppStrings.h"
#include "common/SafeFile.h"

#include <QCoreApplication>
#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <iostream>
#include <utility>
#include <vector>

void FtpServerConfig::remember(const QString &key, const ConfigFile &document)
{
    m_loadedText[key] = document.text();
}

bool FtpServerConfig::unchanged(const QString &key, const std::string &printed) const
{
    const auto it = m_loadedText.find(key);
    return it != m_loadedText.end() && it->second == printed;
}

namespace {

// Links are followed only through directories root alone may change, up to
// the root directory the program works in.
QString trustedTop(const RootDirectory &root)
{
    return root.isSystemRoot() ? QStringLiteral("/") : root.path();
}

} // namespace

std::optional<QString> FtpServerConfig::writeFile(const QString &file, const QByteArray &content)
{
    return writeFileAtomically(file, content, 0644, trustedTop(m_root));
}

std::optional<QString> FtpServerConfig::writeSideFile(const QByteArray &path, const QByteArray &content)
{
    if (const auto error = writeFile(resolved(path), content))
        return error;
    const auto loaded = m_loadedText.find(text(path));
    if (loaded != m_loadedText.end())
        loaded->second = content.toStdString();
    return std::nullopt;
}

void FtpServerConfig::reportUnsaved(const QString &shown, const QString &reason)
{
    m_interaction.show({Interaction::Icon::Critical, QString(), tr("Unable to save %1").arg(shown), QString(), reason});
}

QByteArray FtpServerConfig::nameListContent(const NameList &names, const QByteArray &path) const
{
    QByteArray content;
    for (const QString &name : names.names()) {
        const QByteArray bytes = name.toUtf8();
        if (bytes.contains('\n') || bytes.contains('\r') || bytes.isEmpty()) {
            std::cerr << "Skipping a name with a line break in " << path.constData() << std::endl;
            continue;
        }
        content += bytes + '\n';
    }
    return content;
}

bool FtpServerConfig::saveNameList(const QByteArray &path, const NameList &names)
{
    const QString shown = text(path);
    const QString file = resolved(path);
    const QByteArray content = nameListContent(names, path);
    // A list whose names did not change stays as the administrator wrote
    // it; a missing one is created, since an enabled list without its file
    // stops the server.
    if (QFileInfo(file).isFile() && unchanged(shown, content.toStdString()))
        return true;
    const QString directory = directoryOf(file);
    if (!QDir().mkpath(directory)) {
        m_interaction.warn(QString(), tr("Unable to create path %1. Server may not start.").arg(directoryOf(shown)));
    }
    if (const auto error = writeFile(file, content)) {
        reportUnsaved(shown, *error);
        return false;
    }
    m_loadedText[shown] = content.toStdString();
    return true;
}

bool FtpServerConfig::saveUserConfigs()
{
    bool ok = true;
    const QString directory = resolved(m_userConfigDir);
    if (!QDir().mkpath(directory)) {
        m_interaction.warn(QString(), tr("Unable to create path %1. Server may not start.").arg(text(m_userConfigDir)));
        std::cerr << "Unable to create userconf dir: " << m_userConfigDir.constData() << std::endl;
        ok = false;
    }
    // Written together: synced as one batch and their directory once,
    // rather than two waits for the disk for each file, with every file
    // still old or new after a crash.
    AtomicBatch batch;
    std::vector<std::pair<QString, std::string>> written; // shown path, printed text
    for (const auto &[user, document] : m_userConfigs) {
        const QString shown = text(m_userConfigDir + user);
        std::string printed = document->text();
        if (unchanged(shown, printed))
            continue;
        // The program has always ended these files with an empty line; one
        // that has it already (read back from an earlier save) gets no
        // second, or every save would grow the file by a line.
        const bool endsEmpty = printed.size() >= 2 && printed.compare(printed.size() - 2, 2, "\n\n") == 0;
        const QByteArray content = QByteArray::fromStdString(printed) + (endsEmpty ? "" : "\n");
        if (const auto reason = invalidNameReason(user)) {
            m_interaction.critical(QString(),
                                   tr("Unable to save %1").arg(shown) + QLatin1Char('\n')
                                       + tr("\"%1\" cannot be a file name: %2.").arg(text(user), *reason));
            continue;
        }
        // A refused file comes back from commit() in its place.
        batch.add(resolved(m_userConfigDir + user), content, 0644, trustedTop(m_root));
        written.emplace_back(shown, std::move(printed));
    }
    const auto results = batch.commit();
    for (std::size_t i = 0; i < written.size(); ++i) {
        if (results[i]) {
            reportUnsaved(written[i].first, *results[i]);
            ok = false;
        } else {
            m_loadedText[written[i].first] = std::move(written[i].second);
        }
    }
    return ok;
}

bool FtpServerConfig::save()
{
    if (m_mode == Mode::ReadOnly)
        return false;
    bool ok = true;

    // 1. Virtual users.
    try {
        if (m_accounts)
            m_accounts->saveVirtualUsers();
    } catch (const std::exception &e) {
        m_interaction.critical(QString(),
                               tr("Unable to save virtual users. Message: ") + QString::fromLocal8Bit(e.what()));
        ok = false;
    } catch (...) {
        m_interaction.critical(QString(), tr("Unable to save virtual users. Unknown error."));
        ok = false;
    }

    // 2. Userlist, always enabled afterwards.
    m_userlistPath = configuredUserlistPath();
    ok = saveNameList(m_userlistPath, m_userlist) && ok;
    setValue(m_main.elements, "", "userlist_enable", "yes");
    // The server's own default is another file (/etc/vsftpd.user_list): an
    // enabled list it cannot read would stop every login, so the server is
    // told which file the program keeps.
    if (!findData(m_main.elements, "", "userlist_file"))
        appendData(m_main.elements, "userlist_file", m_userlistPath.toStdString());
    m_userlistModified = false;

    // 3. Chroot list.
    m_chrootListPath = configuredChrootListPath();
    ok = saveNameList(m_chrootListPath, m_chrootList) && ok;
    m_chrootListModified = false;

    // 4. Per-user files.
    ok = saveUserConfigs() && ok;

    // 5. PAM file.
    const QString pamPath = AppStrings::instance().pamDirectory + text(value("pam_service_name", "vsftpd"));
    if (!QFileInfo(resolved(QFile::encodeName(pamPath))).isFile()) {
        m_interaction.critical(tr("Save PAM file"),
                               tr("Unable to find vsftpd PAM config file (default is in /etc/pam.d/vsftpd).\nIt is "
                                  "neccesary for virtual users mechanism. Create it and re-run ftp config"));
        ok = false;
    } else if (!unchanged(pamPath, m_pam.text())) {
        if (const auto error
            = writeFile(resolved(QFile::encodeName(pamPath)), QByteArray::fromStdString(m_pam.text()))) {
            std::cout << "File " << QFile::encodeName(pamPath).constData() << " could not be created or opened"
                      << std::endl;
            reportUnsaved(pamPath, *error);
            ok = false;
        } else {
            remember(pamPath, m_pam);
        }
    }

    // 6. The pam_listfile list. A missing one is not created: its absence
    // is what the rule's onerr= decides on.
    if (m_ftpusersRule) {
        const QString listPath = text(m_ftpusersRule->file);
        if (!QFileInfo(resolved(m_ftpusersRule->file)).isFile()) {
            std::cout << "File " << m_ftpusersRule->file.constData() << " not found" << std::endl;
        } else if (!unchanged(listPath, m_ftpusers.text())) {
            if (const auto error
                = writeFile(resolved(m_ftpusersRule->file), QByteArray::fromStdString(m_ftpusers.text()))) {
                std::cout << "Ftpusers file (" << m_ftpusersRule->file.constData() << ") could not be open"
                          << std::endl;
                reportUnsaved(listPath, *error);
                ok = false;
            } else {
                remember(listPath, m_ftpusers);
            }
        }
        m_ftpusersModified = false;
    }

    // 7. Main configuration.
    const QString mainPath = AppStrings::instance().mainConfigPath;
    if (!unchanged(mainPath, m_main.text())) {
        if (const auto error = writeFile(m_root.resolve(mainPath), QByteArray::fromStdString(m_main.text()))) {
            reportUnsaved(mainPath, *error);
            ok = false;
        } else {
            remember(mainPath, m_main);
        }
    }
    if (ok)
        m_modified = false;
    return ok;
}
