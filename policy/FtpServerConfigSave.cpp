// Saving of FtpServerConfig: every store written back through one writer.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"
#include "UnifiedDiff.h"

#include "common/AppStrings.h"
#include "common/SafeFile.h"

#include <QCoreApplication>
#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <iostream>
#include <map>
#include <stdexcept>
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

// What a save does, step by step: files in the order they are written,
// with the problems and directories met on the way in their place. The
// database of virtual users is written before them all and is no step.
struct FtpServerConfig::SaveWork
{
    enum class Kind {
        List, // a name list: its directory made first
        UserConfigDir, // made before the per-user files, even when none changed
        UserConfig, // the per-user files, written together
        File, // the PAM file, the pam_listfile list, the main configuration
        Problem, // a critical message
        Log, // a line on standard output
    };
    struct Step
    {
        Kind kind;
        QString shown; // the path as the administrator knows it, or the message's title
        QString file; // resolved under the root
        QByteArray content;
        std::string remembered; // what the document prints once written
        QString message; // of a problem or a log line; for a file, logged when it fails
        bool fails = false;
    };
    std::vector<Step> steps;
    QByteArray userlistPath;
    QByteArray chrootListPath;

    bool writes(const Step &step) const
    {
        return step.kind == Kind::List || step.kind == Kind::UserConfig || step.kind == Kind::File;
    }
};

FtpServerConfig::SaveWork FtpServerConfig::prepareSave(ConfigFile &main) const
{
    using Kind = SaveWork::Kind;
    SaveWork work;
    const auto nameList = [&](const QByteArray &path, const NameList &names) {
        const QString file = resolved(path);
        const QByteArray content = nameListContent(names, path);
        // A list whose names did not change stays as the administrator wrote
        // it; a missing one is created, since an enabled list without its
        // file stops the server.
        if (QFileInfo(file).isFile() && unchanged(text(path), content.toStdString()))
            return;
        work.steps.push_back({Kind::List, text(path), file, content, content.toStdString(), {}, false});
    };
    const auto document
        = [&](const QString &shown, const QString &file, const ConfigFile &changed, const QString &log) {
              std::string printed = changed.text();
              if (unchanged(shown, printed))
                  return;
              const QByteArray content = QByteArray::fromStdString(printed);
              work.steps.push_back({Kind::File, shown, file, content, std::move(printed), log, false});
          };

    // Userlist, always enabled afterwards.
    work.userlistPath = configuredUserlistPath();
    nameList(work.userlistPath, m_userlist);
    setValue(main.elements, "", "userlist_enable", "yes");
    // The server's own default is another file (/etc/vsftpd.user_list): an
    // enabled list it cannot read would stop every login, so the server is
    // told which file the program keeps.
    if (!findData(main.elements, "", "userlist_file"))
        appendData(main.elements, "userlist_file", work.userlistPath.toStdString());

    // Chroot list.
    work.chrootListPath = configuredChrootListPath();
    nameList(work.chrootListPath, m_chrootList);

    // Per-user files.
    work.steps.push_back({Kind::UserConfigDir, text(m_userConfigDir), resolved(m_userConfigDir), {}, {}, {}, true});
    std::vector<SaveWork::Step> userFiles;
    for (const auto &[user, userDocument] : m_userConfigs) {
        const QString shown = text(m_userConfigDir + user);
        std::string printed = userDocument->text();
        if (unchanged(shown, printed))
            continue;
        if (const auto reason = invalidNameReason(user)) {
            work.steps.push_back({Kind::Problem,
                                  QString(),
                                  {},
                                  {},
                                  {},
                                  tr("Unable to save %1").arg(shown) + QLatin1Char('\n')
                                      + tr("\"%1\" cannot be a file name: %2.").arg(text(user), *reason),
                                  false});
            continue;
        }
        // The program has always ended these files with an empty line; one
        // that has it already (read back from an earlier save) gets no
        // second, or every save would grow the file by a line.
        const bool endsEmpty = printed.size() >= 2 && printed.compare(printed.size() - 2, 2, "\n\n") == 0;
        const QByteArray content = QByteArray::fromStdString(printed) + (endsEmpty ? "" : "\n");
        userFiles.push_back(
            {Kind::UserConfig, shown, resolved(m_userConfigDir + user), content, std::move(printed), {}, false});
    }
    work.steps.insert(work.steps.end(), std::make_move_iterator(userFiles.begin()),
                      std::make_move_iterator(userFiles.end()));

    // PAM file.
    const QString pamPath = AppStrings::instance().pamDirectory + text(value("pam_service_name", "vsftpd"));
    const QString pamFile = resolved(QFile::encodeName(pamPath));
    if (!QFileInfo(pamFile).isFile()) {
        work.steps.push_back({Kind::Problem,
                              tr("Save PAM file"),
                              {},
                              {},
                              {},
                              tr("Unable to find vsftpd PAM config file (default is in /etc/pam.d/vsftpd).\nIt is "
                                 "neccesary for virtual users mechanism. Create it and re-run ftp config"),
                              true});
    } else {
        document(pamPath, pamFile, m_pam, QStringLiteral("File %1 could not be created or opened").arg(pamPath));
    }

    // The pam_listfile list. A missing one is not created: its absence is
    // what the rule's onerr= decides on.
    if (m_ftpusersRule) {
        const QString listPath = text(m_ftpusersRule->file);
        const QString listFile = resolved(m_ftpusersRule->file);
        if (!QFileInfo(listFile).isFile())
            work.steps.push_back(
                {Kind::Log, listPath, {}, {}, {}, QStringLiteral("File %1 not found").arg(listPath), false});
        else
            document(listPath, listFile, m_ftpusers,
                     QStringLiteral("Ftpusers file (%1) could not be open").arg(listPath));
    }

    // Main configuration.
    const QString mainPath = AppStrings::instance().mainConfigPath;
    document(mainPath, m_root.resolve(mainPath), main, QString());
    return work;
}

QByteArray FtpServerConfig::PlannedFile::diff() const
{
    const QByteArray relative = QFile::encodeName(path.startsWith(QLatin1Char('/')) ? path.mid(1) : path);
    const QByteArray to = "b/" + relative;
    const QByteArray from = exists ? "a/" + relative : QByteArrayLiteral("/dev/null");
    const QByteArray text = unifiedDiff(current, next, from, to);
    return text.isEmpty() && !exists ? "--- " + from + "\n+++ " + to + '\n' : text;
}

FtpServerConfig::SavePlan FtpServerConfig::planSave() const
{
    // A copy by print and parse: the documents share their elements, and a
    // plan must leave the configuration as it found it.
    ConfigFile main = m_main;
    main.parseText(m_main.text());
    const SaveWork work = prepareSave(main);
    SavePlan plan;
    for (const SaveWork::Step &step : work.steps) {
        if (!work.writes(step))
            continue;
        PlannedFile file{step.shown, {}, step.content, false};
        QFile onDisk(step.file);
        if (QFileInfo(step.file).isFile() && onDisk.open(QIODevice::ReadOnly)) {
            file.current = onDisk.readAll();
            file.exists = true;
        }
        plan.files.push_back(std::move(file));
    }
    if (m_accounts && m_accounts->virtualUsersChanged()) {
        plan.virtualUsersPath = m_dbPath;
        for (const auto &[name, record] : m_accounts->virtualUsers()) {
            switch (record.state) {
            case VirtualUserState::Added:
                plan.addedVirtualUsers.append(name);
                break;
            case VirtualUserState::Modified:
                plan.changedVirtualUsers.append({name, record.previousName});
                break;
            case VirtualUserState::Deleted:
                plan.removedVirtualUsers.append(name);
                break;
            case VirtualUserState::Unchanged:
                break;
            }
        }
    }
    return plan;
}

bool FtpServerConfig::writeUserConfigs(const SaveWork &work, std::size_t first, std::size_t end)
{
    // Written together: synced as one batch and their directory once,
    // rather than two waits for the disk for each file, with every file
    // still old or new after a crash. The versions they replace are kept
    // first, in a batch of their own; a file whose version could not be
    // kept is left as it is.
    AtomicBatch backups;
    std::vector<std::size_t> backedUp;
    for (std::size_t i = first; i < end; ++i) {
        if (QFileInfo(work.steps[i].file).isFile() && !m_createdFiles.contains(work.steps[i].shown)) {
            backups.addBackup(work.steps[i].file, trustedTop(m_root));
            backedUp.push_back(i);
        }
    }
    std::map<std::size_t, QString> refused;
    const auto kept = backups.commit();
    for (std::size_t k = 0; k < backedUp.size(); ++k) {
        if (kept[k])
            refused[backedUp[k]] = tr("the previous version could not be kept: %1").arg(*kept[k]);
    }
    AtomicBatch batch;
    std::vector<std::size_t> written;
    for (std::size_t i = first; i < end; ++i) {
        if (refused.count(i))
            continue;
        // A refused file comes back from commit() in its place.
        batch.add(work.steps[i].file, work.steps[i].content, 0644, trustedTop(m_root));
        written.push_back(i);
    }
    const auto results = batch.commit();
    for (std::size_t k = 0; k < written.size(); ++k) {
        if (results[k])
            refused[written[k]] = *results[k];
        else
            m_loadedText[work.steps[written[k]].shown] = work.steps[written[k]].remembered;
    }
    for (const auto &[index, reason] : refused)
        reportUnsaved(work.steps[index].shown, reason);
    return refused.empty();
}

bool FtpServerConfig::save()
{
    using Kind = SaveWork::Kind;
    if (m_mode == Mode::ReadOnly)
        return false;
    bool ok = true;

    // 1. Virtual users. The file is copied before the transaction rather
    // than kept by the environment's logs: pam_userdb and db_load read a
    // plain hash file, which is what an administrator can put back.
    try {
        if (m_accounts) {
            const QString database = resolved(m_dbPath);
            if (m_accounts->virtualUsersChanged() && QFileInfo(database).isFile()) {
                if (const auto error = writeBackup(database, trustedTop(m_root), 0600, true))
                    throw std::runtime_error(
                        tr("the previous version could not be kept: %1").arg(*error).toLocal8Bit().toStdString());
            }
            m_accounts->saveVirtualUsers();
        }
    } catch (const std::exception &e) {
        m_interaction.critical(QString(),
                               tr("Unable to save virtual users. Message: ") + QString::fromLocal8Bit(e.what()));
        ok = false;
    } catch (...) {
        m_interaction.critical(QString(), tr("Unable to save virtual users. Unknown error."));
        ok = false;
    }

    // 2. to 7. The userlist (always enabled afterwards), the chroot list,
    // the per-user files, the PAM file, the pam_listfile list and the main
    // configuration.
    const SaveWork work = prepareSave(m_main);
    m_userlistPath = work.userlistPath;
    m_userlistModified = false;
    m_chrootListPath = work.chrootListPath;
    m_chrootListModified = false;
    if (m_ftpusersRule)
        m_ftpusersModified = false;
    for (std::size_t i = 0; i < work.steps.size();) {
        const SaveWork::Step &step = work.steps[i];
        switch (step.kind) {
        case Kind::Problem:
            m_interaction.critical(step.shown, step.message);
            ok = ok && !step.fails;
            break;
        case Kind::Log:
            std::cout << step.message.toLocal8Bit().constData() << std::endl;
            break;
        case Kind::UserConfigDir:
            if (!QDir().mkpath(step.file)) {
                m_interaction.warn(QString(), tr("Unable to create path %1. Server may not start.").arg(step.shown));
                std::cerr << "Unable to create userconf dir: " << QFile::encodeName(step.shown).constData()
                          << std::endl;
                ok = false;
            }
            break;
        case Kind::UserConfig: {
            std::size_t end = i;
            while (end < work.steps.size() && work.steps[end].kind == Kind::UserConfig)
                ++end;
            ok = writeUserConfigs(work, i, end) && ok;
            i = end;
            continue;
        }
        case Kind::List:
        case Kind::File: {
            if (step.kind == Kind::List && !QDir().mkpath(directoryOf(step.file)))
                m_interaction.warn(QString(),
                                   tr("Unable to create path %1. Server may not start.").arg(directoryOf(step.shown)));
            std::optional<QString> error;
            if (QFileInfo(step.file).isFile()) {
                if (const auto notKept = writeBackup(step.file, trustedTop(m_root)))
                    error = tr("the previous version could not be kept: %1").arg(*notKept);
            }
            if (!error)
                error = writeFile(step.file, step.content);
            if (error) {
                if (!step.message.isEmpty())
                    std::cout << step.message.toLocal8Bit().constData() << std::endl;
                reportUnsaved(step.shown, *error);
                ok = false;
            } else {
                m_loadedText[step.shown] = step.remembered;
            }
            break;
        }
        }
        ++i;
    }
    if (ok)
        m_modified = false;
    return ok;
}
