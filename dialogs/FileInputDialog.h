#pragma once

#include "common/RootDirectory.h"

#include <QDialog>

#include <memory>

namespace Ui {
class FileInputDialog;
}

// Asks for the path of a file (the virtual users database) with a label
// that says why. The path is the one the administrator knows; the checks on
// disk look under the root directory.
class FileInputDialog : public QDialog
{
    Q_OBJECT

public:
    explicit FileInputDialog(QWidget *parent = nullptr, const RootDirectory &root = RootDirectory::fromEnvironment());
    ~FileInputDialog() override;

    void setLabelText(const QString &label);
    void setText(const QString &path);
    QString text() const;

    // Creates the directory of the entered path with all parents; says so
    // in a box when it cannot.
    bool ensureDirectory();

    // Takes a file name chosen in the file dialog (as the administrator
    // knows it): refused with a box when it names something that is not a
    // file, otherwise put in the line edit with ".db" appended when missing.
    bool takeSelectedFile(const QString &path);

public Q_SLOTS:
    void showSelectFileDialog();

private:
    std::unique_ptr<Ui::FileInputDialog> m_ui;
    RootDirectory m_root;
};
