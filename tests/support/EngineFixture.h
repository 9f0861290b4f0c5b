#pragma once

#include "FixtureRoot.h"
#include "Scenario.h"
#include "ScriptedInteraction.h"
#include "policy/FtpServerConfig.h"

#include <memory>
#include <string>

// One engine on a fixture root, started as the program starts it: the files
// written over the fixture's defaults, the virtual user "vic" (password
// "secret") in /etc/vsftpd/virtual.db, which the tests' PAM files name, the
// interaction scripted, the standard streams captured while it loads.
struct EngineFixture
{
    explicit EngineFixture(FtpServerConfig::Mode mode = FtpServerConfig::Mode::ReadWrite);

    // write(), then start().
    bool load(const FileMap &files = {});
    // The row's files; each "passwd" field is one more line of /etc/passwd.
    bool load(const Scenario &scenario);
    bool write(const FileMap &files = {});
    // A new engine on the root as it is now, as at the next program start.
    // False when the load ended the process (exitStatus tells how).
    bool start();

    // The main configuration and a per-user file as they would be saved.
    QByteArray mainText() const;
    QByteArray userFile(const QByteArray &user) const;

    FtpServerConfig::Mode mode;
    FixtureRoot root;
    FileMap files; // as written: the fixture's defaults and the given files
    ScriptedInteraction interaction;
    std::unique_ptr<FtpServerConfig> config;
    std::string out; // of the last start
    std::string err;
    int exitStatus = 0;
};
