// The PAM virtual-user check of FtpServerConfig and its fix.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"

#include "common/AppStrings.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QSettings>

#include <iostream>
#include <tuple>

#ifndef FTPCONFIG_MULTIARCH
#define FTPCONFIG_MULTIARCH ""
#endif

QByteArray FtpServerConfig::pamUserdbModule()
{
    const QByteArray multiarch = FTPCONFIG_MULTIARCH;
    return multiarch.isEmpty() ? QByteArray("/lib/security/pam_userdb.so")
                               : "/lib/" + multiarch + "/security/pam_userdb.so";
}

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
    // The answer is the same for every virtual user of a pass: the PAM file
    // is walked once, unless the walk asked the operator something (what it
    // asks is answered once and changes the next walk).
    if (interactive || !m_pass || !isVirtualUser(user))
        return walkPamUserdb(user, interactive, failure);
    if (!m_pass->pamUserdb) {
        const auto state = std::make_tuple(m_skipPamCheck, m_pamSkipped, m_pamQuestions);
        AccessFailure found;
        const bool passed = walkPamUserdb(user, false, &found);
        if (state != std::make_tuple(m_skipPamCheck, m_pamSkipped, m_pamQuestions)) {
            if (failure)
                *failure = found;
            return passed;
        }
        m_pass->pamUserdb.emplace(passed, found);
    }
    if (failure && !m_pass->pamUserdb->second.message.isEmpty())
        *failure = m_pass->pamUserdb->second;
    return m_pass->pamUserdb->first;
}

bool FtpServerConfig::walkPamUserdb(const QByteArray &user, bool interactive, AccessFailure *failure)
{
    // Read once: the table asks for every virtual user.
    if (!m_skipPamCheck)
        m_skipPamCheck = QSettings().value(QStringLiteral("skip_pam_check"), false).toBool();
    if (*m_skipPamCheck)
        return true;
    if (!isVirtualUser(user))
        return true;
    // Skip holds for the rest of this run: the table checks every virtual
    // user, and thousands of them would each ask again.
    if (m_pamSkipped)
        return false;
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
            ++m_pamQuestions;
            const Interaction::PamChoice choice = m_interaction.askPamProblem();
            if (choice == Interaction::PamChoice::Skip) {
                m_pamSkipped = true;
                return false;
            }
            if (choice == Interaction::PamChoice::Valid) {
                QSettings().setValue(QStringLiteral("skip_pam_check"), true);
                m_skipPamCheck = true;
                return true;
            }
            // A fix that was cancelled or failed counts as Skip: asked once.
            m_pamSkipped = !fixPamUserdb();
            return !m_pamSkipped;
        }

        for (auto argument = std::next(module); argument != line->tokens.end(); ++argument) {
            if (argument->text.compare(0, 3, "db=") != 0)
                continue;
            // The file pam_userdb opens: ".db" appended whatever db= ends in.
            QByteArray path = QByteArray::fromStdString(argument->text.substr(3));
            if (!path.isEmpty())
                path += ".db";
            if (pathStatus(path))
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
    // The file pam_userdb opens: accepted as it stands, the trailing ".db"
    // taken off below gives back the same db= value.
    QString initial = QString::fromStdString(moduleArgument(m_pam.elements, "pam_userdb.so", "db"));
    if (!initial.isEmpty())
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
