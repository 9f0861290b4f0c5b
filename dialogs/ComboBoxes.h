#pragma once

#include <QComboBox>
#include <QString>

// Selects the entry with that text; a value the combo has no entry for (an
// account or group the store does not know, an address of another machine)
// is added, so that it still shows and is kept as it was.
inline void selectOrAdd(QComboBox *combo, const QString &text)
{
    int found = combo->findText(text);
    if (found < 0) {
        combo->addItem(text);
        found = combo->count() - 1;
    }
    combo->setCurrentIndex(found);
}
