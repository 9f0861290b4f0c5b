#include "Interaction.h"

Interaction::~Interaction() = default;

void Interaction::inform(const QString &title, const QString &text)
{
    show({Icon::Information, title, text, {}, {}});
}

void Interaction::warn(const QString &title, const QString &text)
{
    show({Icon::Warning, title, text, {}, {}});
}

void Interaction::critical(const QString &title, const QString &text)
{
    show({Icon::Critical, title, text, {}, {}});
}
