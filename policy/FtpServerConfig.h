#pragma once

#include "accounts/AccountStore.h"
#include "common/RootDirectory.h"
#include "config/ConfigFile.h"
#include "policy/AccessFailure.h"
#include "policy/Interaction.h"
#include "policy/NameList.h"

#include <QByteArray>
#include <QCoreApplication>
#include <QHash>
#include <QSet>
#include <QString>
#include <QStringList>

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include <sys/stat.h>

// Everything that decides who may use the FTP server, held in memory: the
// main configuration, the PAM service file, the lists, the per-user files,
// the accounts and the virtual users. Checks read it, repairs change it,
// and only a save writes it back.
class FtpServerConfig
{
    Q_DECLARE_TR_FUNCTIONS(FtpServerConfig)

public:
    // ReadOnly creates and changes nothing under the root: a missing main
    // configuration reads as "listen=YES", no directory, environment or
    // database file is made, and a repair that would change a directory at
    // once (create it, its owner, its mode) counts as made without touching
    // it, so that an edit can be planned (planSave()) as it would be saved.
    enum class Mode { ReadWrite, ReadOnly };
    enum class UserlistMode { Off = 0, Allow = 1, Deny = 2 };

    // The arguments of the pam_listfile.so line of the PAM file.
    struct FtpusersRule
    {
        QByteArray item;
        QByteArray sense;
        QByteArray file;
        QByteArray onerr;
        QByteArray apply;
    };

    FtpServerConfig(Interaction &interaction, const RootDirectory &root, Mode mode = Mode::ReadWrite);
    ~FtpServerConfig();

    FtpServerConfig(const FtpServerConfig &) = delete;
    FtpServerConfig &operator=(const FtpServerConfig &) = delete;

    // Reads every file; a fatal problem ends the process through the
    // interaction with status -1.
    void load();

    // While a pass is open, the checks and the forecast read the metadata of
    // each path and each main configuration value once: a pass over every
    // user stats the same guest root and database file once, not once a
    // user. A check with repair reads afresh and empties the cache, since
    // it may create directories and change values; nothing else may change
    // the documents while a pass is open. Passes nest.
    class MetadataPass
    {
    public:
        explicit MetadataPass(FtpServerConfig &config);
        ~MetadataPass();
        MetadataPass(const MetadataPass &) = delete;
        MetadataPass &operator=(const MetadataPass &) = delete;
        // The caller took the user from the virtual users' names: the
        // checks that follow do not search the 100,000 names for it again.
        void knownVirtualUser(const QByteArray &user);

    private:
        FtpServerConfig &m_config;
        bool m_outer;
    };
    // stat() of a path already resolved under the root, following links;
    // empty when it fails.
    std::optional<struct stat> fileStatus(const QString &resolvedPath) const;
    // The same for a path as the files name it: within a pass it is
    // resolved once, however many users share it (a guest root).
    std::optional<struct stat> pathStatus(const QByteArray &path) const;

    // May the user log in? With repair, each refusal that a change of the
    // in-memory files can cure is cured, and the operator is asked where a
    // directory would change at once. The failure is filled only on refusal.
    bool checkAccess(const QByteArray &user, bool repair, AccessFailure *failure = nullptr);

    bool checkMainConfig(const QByteArray &user, bool repair, AccessFailure *failure);
    bool checkReserved(const QByteArray &user, bool repair, AccessFailure *failure);
    bool checkRootDirectory(const QByteArray &user, bool repair, AccessFailure *failure);
    bool checkFtpusers(const QByteArray &user, bool repair, AccessFailure *failure);
    bool checkUserlist(const QByteArray &user, bool repair, AccessFailure *failure);
    bool checkPassword(const QByteArray &user, bool repair, AccessFailure *failure);
    bool checkPamUserdb(const QByteArray &user, bool interactive, AccessFailure *failure);
    bool walkPamUserdb(const QByteArray &user, bool interactive, AccessFailure *failure);

    bool isAnonymousUser(const QByteArray &user) const;
    bool isVirtualUser(const QByteArray &user) const;
    UserlistMode userlistMode() const;
    bool isChrooted(const QByteArray &user) const;
    // The directory that becomes the user's FTP root, as the administrator
    // knows it (not resolved under the root directory).
    QByteArray effectiveRoot(const QByteArray &user) const;
    // The directory the user's sessions start in, as the administrator wrote
    // it (local_root, anon_root) or else the home the server falls back to:
    // the FTP root once the user is confined.
    QByteArray configuredRoot(const QByteArray &user) const;
    // Virtual users of the table: those removed but not yet saved are gone.
    QList<QByteArray> virtualUserNames() const;
    // The system account whose rights the user's FTP session has.
    QByteArray ftpAccountName(const QByteArray &user) const;

    void blockUserByUserlist(const QByteArray &user);
    // Creates the directory with its parents and gives it to the user's
    // account. False with a Filesystem failure when it cannot be created.
    bool createRootDirectory(const QByteArray &user, const QByteArray &directory, AccessFailure *failure = nullptr);

    // Rights ------------------------------------------------------------
    // The rights list of the table's mode column, from the keys of the
    // user's per-user file (the main configuration for the anonymous user)
    // over those of the main configuration and the server's defaults; all
    // four rights show as "full access". Untranslated words.
    QStringList userRights(const QByteArray &user) const;
    // Writes the keys of the rights, given as their display string
    // ("write, download"), into the user's per-user file (created when
    // missing) or, for the anonymous user, into the main configuration.
    bool setUserRights(const QByteArray &user, const QString &rights);
    // Creates the user's per-user file on disk with its first comment line
    // and registers it (read-only: in memory only, for the next save to
    // write). Refuses names that cannot be file names.
    bool createUserConfig(const QByteArray &user);
    // anon_root for the anonymous user, local_root in the per-user file for
    // everybody else.
    bool setUserRoot(const QByteArray &user, const QByteArray &directory);
    // Confines a local user to its root through the chroot keys and list.
    void setChrooted(const QByteArray &user);
    // Asks whether a user who is not confined should be, now that the
    // directory becomes the user's root; confines on Yes.
    void offerChroot(const QByteArray &user, const QByteArray &directory);
    // Compares the rights with the permission bits of the user's root and
    // offers to fix the bits; changes the directory at once.
    void checkFolderPermissions(const QByteArray &user, const QStringList &rights);
    // The same for a directory that is about to become the user's root.
    void checkFolderPermissions(const QByteArray &user, const QStringList &rights, const QByteArray &directory);

    // Writes back everything loaded and changed, store by store; a failure
    // is reported and the next store is written all the same. True when
    // nothing failed. Files whose content did not change are not touched;
    // each file replaced is kept first as FILE.ftpconfig-bak (the virtual
    // users database too), with the mode and owner it had.
    bool save();

    // One file a save would write.
    struct PlannedFile
    {
        QString path; // as the administrator knows it
        QByteArray current; // on disk now; empty when the file does not exist yet
        QByteArray next; // what the save writes
        bool exists = false;
        // "diff -u" from the file as it is, a/ and b/ before the path; a
        // new empty file, of which diff says nothing, shows its headers.
        QByteArray diff() const;
    };
    // What save() would write now, in its order, computed by the same steps
    // and writing nothing. The virtual users database shows only names.
    struct SavePlan
    {
        std::vector<PlannedFile> files;
        QByteArray virtualUsersPath; // as the administrator knows it
        QList<QByteArray> addedVirtualUsers;
        // A new password or a new name; second is the name on disk before a
        // rename, empty for a password change.
        QList<std::pair<QByteArray, QByteArray>> changedVirtualUsers;
        QList<QByteArray> removedVirtualUsers;
    };
    SavePlan planSave() const;

    // The list files as the main configuration names them now, or the
    // program's defaults.
    QByteArray configuredUserlistPath() const;
    QByteArray configuredChrootListPath() const;

    // Options of the main configuration, as the options dialog changes them;
    // both mark the configuration modified. optionsChanged() follows what
    // the changed options name (another chroot list).
    void setOption(const QByteArray &key, const QByteArray &value);
    void removeOption(const QByteArray &key);
    void optionsChanged();
    // A side file the options name (banner, message, e-mail or chroot
    // list), written at once through the same writer as a save. Nothing on
    // success, otherwise why not. A list the engine holds counts as saved
    // with this content, so that the next save leaves the file alone.
    std::optional<QString> writeSideFile(const QByteArray &path, const QByteArray &content);
    // The chroot list the options dialog accepted, for the list file the
    // options now name: it replaces the one in memory, which would
    // otherwise be written over the dialog's at the next save.
    void setChrootList(const QByteArray &path, const QStringList &names);

    // Main configuration value of a key, or the default when absent.
    QByteArray value(const QByteArray &key, const QByteArray &defaultValue = {}) const;
    // Lower-cased value compared with "yes"; absent gives the default.
    bool isYes(const QByteArray &key, bool absentMeansYes = false) const;
    // Keys written in the code, looked up by the literal's address within a
    // pass, with nothing made on the heap: the checks ask for several of
    // them for every user.
    template <size_t N> QByteArray value(const char (&key)[N], const QByteArray &defaultValue = {}) const
    {
        return literalValue(key, N - 1).value_or(defaultValue);
    }
    template <size_t N> bool isYes(const char (&key)[N], bool absentMeansYes = false) const
    {
        const std::optional<QByteArray> found = literalValue(key, N - 1);
        return found ? found->compare("yes", Qt::CaseInsensitive) == 0 : absentMeansYes;
    }

    ConfigFile &mainConfig();
    // False when the main configuration was missing at load (and, read-only,
    // was only assumed to be "listen=YES").
    bool mainConfigExisted() const;
    ConfigFile &pamConfig();
    // False when the PAM service file was missing at load (read-only only:
    // otherwise the load ends the process).
    bool pamConfigExisted() const;
    const QByteArray &pamServiceName() const;
    const std::optional<FtpusersRule> &ftpusersRule() const;
    ConfigFile &ftpusersList();
    bool ftpusersModified() const;
    NameList &userlist();
    const QByteArray &userlistPath() const;
    bool userlistModified() const;
    NameList &chrootList();
    const QByteArray &chrootListPath() const;
    bool chrootListModified() const;
    const QByteArray &userConfigDir() const;
    std::map<QByteArray, std::shared_ptr<ConfigFile>> &userConfigs();
    ConfigFile *userConfig(const QByteArray &user) const;
    // The pam_userdb database as the store opens it (".db" appended).
    const QByteArray &virtualUsersDbPath() const;
    AccountStore &accounts();
    const AccountStore &accounts() const;
    const RootDirectory &root() const;
    Interaction &interaction();
    Mode mode() const;

    // Set by every repair and edit of the in-memory files.
    bool isModified() const;
    void setModified(bool modified);

    // The module path the PAM fix writes, fixed when the program is built.
    static QByteArray pamUserdbModule();

private:
    void loadMainConfig();
    void loadPamConfig();
    void loadUserlist();
    void loadFtpusers();
    void loadChrootList();
    void loadUserConfigs();
    void loadVirtualUsers();
    QStringList readNameList(const QByteArray &path) const;
    bool ftpusersListed(const QByteArray &name);
    QString resolved(const QByteArray &path) const;
    // The main configuration's value of a key; empty when it is absent.
    std::optional<QByteArray> mainValue(const QByteArray &key) const;
    template <size_t N> std::optional<QByteArray> mainValue(const char (&key)[N]) const
    {
        return literalValue(key, N - 1);
    }
    std::optional<QByteArray> literalValue(const char *key, int size) const;
    bool ensureDirectoryOf(const QString &path);
    bool fixPamUserdb();
    void remember(const QString &key, const ConfigFile &document);
    bool unchanged(const QString &key, const std::string &text) const;
    QByteArray nameListContent(const NameList &names, const QByteArray &path) const;
    // The files a save writes and the problems it reports, from main (the
    // main configuration itself for a save, a copy for a plan), which gets
    // the keys a save always sets.
    struct SaveWork;
    SaveWork prepareSave(ConfigFile &main) const;
    bool writeUserConfigs(const SaveWork &work, std::size_t first, std::size_t end);
    // Through the atomic writer, trusting links only root could have made
    // under the root directory.
    std::optional<QString> writeFile(const QString &file, const QByteArray &content);
    void reportUnsaved(const QString &shown, const QString &reason);
    ConfigFile *rightsTarget(const QByteArray &user);
    void setYes(const QByteArray &key);

    Interaction &m_interaction;
    RootDirectory m_root;
    Mode m_mode;

    ConfigFile m_main{SyntaxMode::KeyValue};
    bool m_mainConfigExisted = true;
    bool m_pamConfigExisted = true;
    ConfigFile m_pam{SyntaxMode::TokenLine};
    QByteArray m_pamServiceName;
    std::optional<FtpusersRule> m_ftpusersRule;
    ConfigFile m_ftpusers{SyntaxMode::KeyValue};
    bool m_ftpusersModified = false;
    // Names of the ftpusers list; rebuilt after any change of the document.
    QSet<QByteArray> m_ftpusersIndex;
    bool m_ftpusersIndexValid = false;
    std::optional<bool> m_skipPamCheck;
    bool m_pamSkipped = false;
    int m_pamQuestions = 0; // asked of the operator so far
    QByteArray m_userlistPath;
    NameList m_userlist;
    bool m_userlistModified = false;
    QByteArray m_chrootListPath;
    NameList m_chrootList;
    bool m_chrootListModified = false;
    QByteArray m_userConfigDir;
    std::map<QByteArray, std::shared_ptr<ConfigFile>> m_userConfigs;
    QByteArray m_dbPath;
    QByteArray m_dbConfiguredPath; // as the PAM file's db= names it
    std::unique_ptr<AccountStore> m_accounts;
    bool m_modified = false;
    // What the open pass read: metadata by resolved path, main configuration
    // values by key. None when no pass is open.
    struct PassCache
    {
        PassCache();
        const quint64 number; // no two passes of the process share one
        // The file metadata is shared with a forecast that may run on
        // another thread during the pass; the rest is the verdict's own.
        // Each thread also keeps what it looked up by path as written.
        std::mutex statusLock;
        QHash<QString, std::optional<struct stat>> metadata;
        // Whether the last user asked about is a virtual one: a check asks
        // several times, and the set of 100,000 names is slow to reach.
        QByteArray virtualQuery;
        bool virtualAnswer = false;
        // The configured root of the guests without a file or token of
        // their own.
        std::optional<QByteArray> sharedGuestRoot;
        // The last user's effective root.
        QByteArray rootUser;
        QByteArray root;
        // What the PAM file says of every virtual user, with its refusal.
        std::optional<std::pair<bool, AccessFailure>> pamUserdb;
        QHash<QByteArray, std::optional<QByteArray>> values;
        // The same by the address of a key written in the code.
        std::vector<std::pair<const char *, std::optional<QByteArray>>> literals;
    };
    mutable std::unique_ptr<PassCache> m_pass;
    // How each document printed when it was loaded: a save leaves a file
    // that would print the same untouched, byte for byte.
    std::map<QString, std::string> m_loadedText;
    // Per-user files this run created on disk (with their comment line
    // only): a save keeps no backup of them, nobody's version is lost.
    QSet<QString> m_createdFiles;
};

// The translated rights words of a list, in the fixed display order.
QString rightsText(const QStringList &rights);
// "rwxr-x---" of the owner, group and other permission bits.
QString permissionLetters(unsigned flags);

// The critical box that explains a refusal.
void showFailureDialog(Interaction &interaction, const AccessFailure &failure);
