#pragma once

#include <QWidget>

class QLineEdit;
class QToolButton;

// The directory cell's editor: the path as text, and a button that asks the
// delegate to open a directory chooser.
class MyEditor : public QWidget
{
    Q_OBJECT

public:
    explicit MyEditor(QWidget *parent = nullptr);

    QString text() const;
    void setText(const QString &text);

signals:
    void fileSelectorRequested();

private:
    QLineEdit *m_lineEdit;
    QToolButton *m_toolButton;
};
