#include "FileInputDialog.h"

#include "ui_FileInputDialog.h"

#include <QDir>
#include <QFileDialog>
#include <QFileInfo>
#include <QMessageBox>

FileInputDialog::FileInputDialog(QWidget *parent, const RootDirectory &root)
    : QDialog(parent)
    , m_ui(std::make_unique<Ui::FileInputDialog>())
    , m_root(root)
{
    m_ui->setupUi(this);
    connect(m_ui->selectFileToolButton, &QToolButton::clicked, this, &FileInputDialog::showSelectFileDialog);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::accepted, this, &QDialog::accept);
    connect(m_ui->dialogButtonBox, &QDialogButtonBox::rejected, this, &QDialog::reject);
}

FileInputDialog::~FileInputDialog() = default;

void FileInputDialog::setLabelText(const QString &label)
{
    m_ui->pathLabel->setText(label);
}

void FileInputDialog::setText(const QString &path)
{
    m_ui->pathLineEdit->setText(path);
}

QString FileInputDialog::text() const
{
    return m_ui->pathLineEdit->text();
}

bool FileInputDialog::ensureDirectory()
{
    const QString directory = QFileInfo(text()).absolutePath();
    if (QDir().mkpath(m_root.resolve(directory)))
        return true;
    QMessageBox::critical(this, tr("Error creating directory"),
                          tr("Unable to create directory %1. Virtual users database will not be created.\n That "
                             "means, that virtual users will not work.")
                              .arg(directory));
    return false;
}

bool FileInputDialog::takeSelectedFile(const QString &path)
{
    const QFileInfo onDisk(m_root.resolve(path));
    if (onDisk.exists() && !onDisk.isFile()) {
        QMessageBox::information(this, tr("Invalid file path"),
                                 tr("You have entered path to existing non-file entity.\nEnter path to existing or "
                                    "not file:\nExample: /var/lib/ftpconfig/virtual_users.db"));
        return false;
    }
    setText(path.endsWith(QLatin1String(".db")) ? path : path + QLatin1String(".db"));
    return true;
}

void FileInputDialog::showSelectFileDialog()
{
    // Starts in the nearest directory of the current path that exists: the
    // path is often one that still has to be made.
    const QFileInfo current(m_root.resolve(text()));
    QString directory = current.absolutePath();
    while (!QFileInfo(directory).isDir() && directory != QLatin1String("/"))
        directory = QFileInfo(directory).path();
    const QString chosen = QFileDialog::getSaveFileName(
        this, tr("Select database file"), QDir(directory).filePath(current.fileName()), QStringLiteral("*.db"));
    if (chosen.isEmpty())
        return;
    // The file dialog browses the disk; the line edit keeps the path as the
    // administrator knows it.
    QString path = chosen;
    if (!m_root.isSystemRoot() && path.startsWith(m_root.path() + QLatin1Char('/')))
        path.remove(0, m_root.path().size());
    takeSelectedFile(path);
}
