#pragma once

#include <QCoreApplication>
#include <QString>
#include <QStringList>

// The translated labels that several parts of the program share, and the
// fixed paths, built once on first use.
class AppStrings
{
    Q_DECLARE_TR_FUNCTIONS(AppStrings)

public:
    static const AppStrings &instance();

    // Group rows of the users table.
    QString everybody;
    QString localUsers;
    QString virtualUsers;
    QString anonymousUsers;
    QString anonymousWord; // the anonymous account as the table names it

    QString allowed;
    QString denied;

    // Rights words, in display order.
    QString fullAccess;
    QString write;
    QString download;
    QString upload;
    QString mkdir;

    QString ownerLabel;
    QString groupLabel;
    QString otherLabel;

    QStringList optionPageTitles;
    QString allInterfaces;

    // Fixed paths and names, as the administrator knows them.
    QString mainConfigPath;
    QString pamDirectory;
    QString passwdPath;
    QString shadowPath;
    QString groupPath;
    QString stateDirectory;
    QString virtualUsersDbName;
    QString anonymousAccount;

private:
    AppStrings();
};
