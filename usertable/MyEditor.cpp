#include "MyEditor.h"

#include <QHBoxLayout>
#include <QLineEdit>
#include <QToolButton>

MyEditor::MyEditor(QWidget *parent)
    : QWidget(parent)
    , m_lineEdit(new QLineEdit(this))
    , m_toolButton(new QToolButton(this))
{
    m_lineEdit->setObjectName(QStringLiteral("pathLineEdit"));
    m_toolButton->setObjectName(QStringLiteral("browseToolButton"));
    m_toolButton->setText(QStringLiteral("..."));
    auto *layout = new QHBoxLayout(this);
    layout->setContentsMargins(0, 0, 0, 0);
    layout->setSpacing(0);
    layout->addWidget(m_lineEdit);
    layout->addWidget(m_toolButton);
    // Typing goes to the path as soon as the cell opens.
    setFocusProxy(m_lineEdit);
    connect(m_toolButton, &QToolButton::clicked, this, &MyEditor::fileSelectorRequested);
}

QString MyEditor::text() const
{
    return m_lineEdit->text();
}

void MyEditor::setText(const QString &text)
{
    m_lineEdit->setText(text);
}
