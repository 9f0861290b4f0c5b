#pragma once

#include <QByteArray>

// The texts compared as "diff -u" compares them: three lines of context,
// hunk headers as GNU diff writes them and "\ No newline at end of file"
// after a last line without one, so that patch applies the result. The
// labels are the header names as given ("a/etc/vsftpd.conf", "/dev/null").
// Empty when the texts are equal.
QByteArray unifiedDiff(const QByteArray &before, const QByteArray &after, const QByteArray &fromLabel,
                       const QByteArray &toLabel);
