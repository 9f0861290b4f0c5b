#pragma once

#include <QString>

#include <cstdint>

// Which file refuses a login. The numbers are part of the scheme: 4 is
// never produced and 7 comes only from the PAM virtual-user check; neither
// has a text.
enum class FailureKind : uint32_t {
    None = 0,
    FtpusersFile = 1,
    UserlistFile = 2,
    MainConfig = 3,
    PasswdShadow = 5,
    Filesystem = 6,
    PamUserDb = 7,
};

struct AccessFailure
{
    FailureKind kind = FailureKind::None;
    QString message;
};

QString failureKindText(FailureKind kind);
QString failureKindText(uint32_t kind);
