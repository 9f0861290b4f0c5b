#pragma once

#include <QByteArray>
#include <QDialog>
#include <QHash>
#include <QModelIndex>
#include <QString>
#include <QStringList>

#include <functional>
#include <memory>
#include <optional>
#include <vector>

class FtpServerConfig;
class QLineEdit;
class QListWidget;
class QPlainTextEdit;

namespace Ui {
class COptionsDialog;
}

// The server-wide settings of the main configuration, page by page, with
// the editors of the files they name. load() fills the widgets before the
// dialog runs; acceptance checks the input and writes the side files;
// save() then stores into the engine every key whose widget the
// administrator changed, so that untouched lines keep their text.
class COptionsDialog : public QDialog
{
    Q_OBJECT

public:
    explicit COptionsDialog(FtpServerConfig &config, QWidget *parent = nullptr);
    ~COptionsDialog() override;

    void load();
    void save();

public slots:
    void addNewCommandListElement();
    void deleteCommandListElement();
    void addNewEmailListElement();
    void deleteEmailListElement();
    void selectMaillistFile();
    void selectPerDirectoryMessageFile();
    void setupMessageListPath();
    void setupChrootUserListPath();
    void reloadMessageFile();
    void addUserToChrootList();
    void excludeUserFromChrootList();
    void switchPage(const QModelIndex &index);

    void accept() override;
    void done(int result) override;

protected:
    bool eventFilter(QObject *watched, QEvent *event) override;

private:
    // One key of the main configuration and the widget that edits it.
    struct Binding
    {
        QByteArray key;
        QByteArray defaultValue;
        std::function<void(const QByteArray &)> show;
        std::function<QByteArray()> text;
        // Why the text cannot be stored, or nothing; changed tells whether
        // the text differs from what the file showed.
        std::function<std::optional<QString>(const QByteArray &text, bool changed)> check;
    };
    // A file named by a key, edited as a list or as text.
    struct SideFile
    {
        QLineEdit *pathEdit;
        QByteArray defaultPath;
        QListWidget *list;
        QPlainTextEdit *textEdit;
        QString icon;
    };

    void bindKeys();
    void fillAddresses();
    void connectEditors();
    void updateButtons();
    void updateChrootLists();
    QByteArray sidePath(const SideFile &file) const;
    // The editor's content as it would be written, and as the named file
    // holds it now; one entry a line for lists.
    QStringList editorLines(const SideFile &file) const;
    QStringList fileLines(const SideFile &file) const;
    void loadSideFile(const SideFile &file);
    void loadChrootLists();
    bool writeSideFiles();
    // Asks for an entry and appends it unless refused or listed already.
    void addListEntry(const QString &label, QListWidget *list, const QString &icon,
                      const std::function<std::optional<QString>(const QString &)> &refusal);
    void deleteCurrent(QListWidget *list);
    void moveSelected(QListWidget *from, QListWidget *to);
    QString choosePath(const QString &title, const QString &startDirectory, const QString &filter = QString());
    void warn(const QString &text);

    std::unique_ptr<Ui::COptionsDialog> m_ui;
    FtpServerConfig &m_config;
    std::vector<Binding> m_bindings;
    // The text each key's widget showed after load.
    QHash<QByteArray, QByteArray> m_shown;
    std::vector<SideFile> m_sideFiles;
    // The parts of the combined choices, while they load.
    bool m_loadedListen = false;
    bool m_loadedChrootListEnable = false;
};
