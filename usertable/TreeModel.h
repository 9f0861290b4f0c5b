#pragma once

#include "forecast/LoginForecast.h"
#include "policy/AccessFailure.h"

#include <QAbstractItemModel>
#include <QByteArray>
#include <QIcon>
#include <QStringList>
#include <QTimer>

#include <memory>
#include <optional>
#include <vector>

class FtpServerConfig;
class Interaction;

// Every user that matters to the FTP server, in a fixed tree: Everybody,
// then Local users, Virtual users and the Anonymous users row. The model
// owns the engine, loads it when it is built, turns edits of the cells into
// engine changes, and keeps the unsaved-changes flag the window mirrors.
// Beside the program's verdict (status) stands the forecast of what vsftpd
// itself will do (server), computed when a row is first shown.
class TreeModel : public QAbstractItemModel
{
    Q_OBJECT

public:
    enum Column { UsersColumn = 0, StatusColumn = 1, DirectoryColumn = 2, ModeColumn = 3, ServerColumn = 4 };
    enum Role {
        // The verdict's failure kind (FailureKind as uint) of a user row.
        FailureKindRole = Qt::UserRole + 1,
        // The forecast status (ForecastStatus as int) of a user row.
        ForecastRole,
        // What the filters ask of a user row, as FilterFlags; none for a group.
        FilterRole,
    };
    enum FilterFlag { SystemUser = 1, AllowedUser = 2 };

    // The titles of the columns; the engine is loaded from the root
    // directory of the environment through the interaction.
    TreeModel(const QStringList &titles, Interaction &interaction, QObject *parent = nullptr);
    ~TreeModel() override;

    QModelIndex index(int row, int column, const QModelIndex &parent = QModelIndex()) const override;
    QModelIndex parent(const QModelIndex &index) const override;
    int rowCount(const QModelIndex &parent = QModelIndex()) const override;
    int columnCount(const QModelIndex &parent = QModelIndex()) const override;
    QVariant data(const QModelIndex &index, int role = Qt::DisplayRole) const override;
    bool setData(const QModelIndex &index, const QVariant &value, int role = Qt::EditRole) override;
    QVariant headerData(int section, Qt::Orientation orientation, int role = Qt::DisplayRole) const override;
    bool setHeaderData(int section, Qt::Orientation orientation, const QVariant &value,
                       int role = Qt::EditRole) override;
    Qt::ItemFlags flags(const QModelIndex &index) const override;

    FtpServerConfig &config();
    bool hasUnsavedChanges() const;
    void setUnsavedChanges(bool unsaved);

    // Every verdict not yet made, at once (a filter by status needs them all).
    void evaluateAll();
    // Discards the rows and builds them again from the engine, in a reset.
    void rebuild();
    // Removes the virtual user of the row from the database (in memory,
    // until saved) and rebuilds.
    void removeVirtualUser(const QModelIndex &index);
    // Adds or renames a virtual user (in memory, until saved) and rebuilds.
    void addVirtualUser(const QByteArray &name, const QByteArray &password);
    void changeVirtualUser(const QByteArray &oldName, const QByteArray &newName, const QByteArray &password);

    QString userName(const QModelIndex &index) const;
    // A user row: neither Everybody nor a group. The anonymous row is one.
    bool isUserRow(const QModelIndex &index) const;
    bool isGroupName(const QString &name) const;
    bool isInVirtualGroup(const QModelIndex &index) const;
    QModelIndex indexOfUser(const QString &name, int column = UsersColumn) const;

    // The verdict and the forecast of a user row; empty for group rows.
    std::optional<AccessFailure> failure(const QModelIndex &index) const;
    std::optional<UserForecast> forecast(const QModelIndex &index) const;
    // What the server refuses before any user logs in.
    const LoginForecast &loginForecast() const;

    // A row of the tree; defined with the model.
    struct Item;

public slots:
    void onSave();

signals:
    // After any change of the engine (an edit, the options, a save): the
    // login check follows.
    void engineChanged();

private:
    Item *itemOf(const QModelIndex &index) const;
    void buildRows();
    // The verdict, directory and rights of a user row, from the engine.
    void compute(Item &item) const;
    void computeDetails(Item &item) const;
    const UserForecast &forecastOf(Item &item) const;
    LoginForecast &loginForecastMutable();
    void refreshAllUsers();
    // Makes every user's verdict ready in idle time, a slice at a time.
    void evaluateLater();
    void evaluateSome();
    // Until done, or for about the given time when not negative.
    void evaluatePending(qint64 milliseconds);
    void markChanged();
    void invalidData(const QString &reason);
    bool setStatus(Item &item, bool allowed);
    bool setDirectory(Item &item, const QString &directory);
    bool setMode(Item &item, const QString &rights);
    bool rename(Item &item, const QString &newName);

    Interaction &m_interaction;
    QStringList m_titles;
    std::unique_ptr<FtpServerConfig> m_config;
    std::unique_ptr<Item> m_root;
    Item *m_localUsers = nullptr;
    Item *m_virtualUsers = nullptr;
    mutable std::unique_ptr<LoginForecast> m_forecast;
    bool m_unsaved = false;
    QTimer m_evaluator;
    bool m_editing = false;
    size_t m_pendingGroup = 0;
    size_t m_pendingRow = 0;
    QIcon m_groupIcon;
    QIcon m_allowedIcon;
    QIcon m_deniedIcon;
};
