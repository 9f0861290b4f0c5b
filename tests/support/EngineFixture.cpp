#include "EngineFixture.h"

#include "CaptureStream.h"

#include <iostream>

EngineFixture::EngineFixture(FtpServerConfig::Mode mode)
    : mode(mode)
{
}

bool EngineFixture::load(const FileMap &files)
{
    return write(files) && start();
}

bool EngineFixture::load(const Scenario &scenario)
{
    FileMap written = scenario.files;
    const QStringList accounts = scenario.values(QStringLiteral("passwd"));
    if (!accounts.isEmpty())
        written[QStringLiteral("/etc/passwd")] = FixtureRoot::defaults().value(QStringLiteral("/etc/passwd"))
            + accounts.join(QLatin1Char('\n')).toUtf8() + '\n';
    return load(written);
}

bool EngineFixture::write(const FileMap &given)
{
    files = FixtureRoot::defaults();
    files.insert(given);
    return root.write(given) && root.writeVirtualUsers(QStringLiteral("/etc/vsftpd/virtual.db"), {{"vic", "secret"}});
}

bool EngineFixture::start()
{
    config = std::make_unique<FtpServerConfig>(interaction, RootDirectory(root.path()), mode);
    CaptureStream capturedOut(std::cout);
    CaptureStream capturedErr(std::cerr);
    exitStatus = 0;
    try {
        config->load();
    } catch (const ProcessExit &exit) {
        exitStatus = exit.status;
    }
    out = capturedOut.text();
    err = capturedErr.text();
    return exitStatus == 0;
}

QByteArray EngineFixture::mainText() const
{
    return QByteArray::fromStdString(config->mainConfig().text());
}

QByteArray EngineFixture::userFile(const QByteArray &user) const
{
    const ConfigFile *file = config->userConfig(user);
    return file ? QByteArray::fromStdString(file->text()) : QByteArray("<none>");
}
