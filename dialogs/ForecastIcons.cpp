#include "ForecastIcons.h"

#include <QApplication>
#include <QStyle>

QIcon forecastStatusIcon(ForecastStatus status)
{
    QStyle *style = QApplication::style();
    switch (status) {
    case ForecastStatus::Allowed:
        return style->standardIcon(QStyle::SP_DialogApplyButton);
    case ForecastStatus::Denied:
        return style->standardIcon(QStyle::SP_DialogCancelButton);
    case ForecastStatus::Unknown:
        break;
    }
    return style->standardIcon(QStyle::SP_MessageBoxQuestion);
}

QIcon severityIcon(ForecastFinding::Severity severity)
{
    QStyle *style = QApplication::style();
    switch (severity) {
    case ForecastFinding::Severity::Error:
        return style->standardIcon(QStyle::SP_MessageBoxCritical);
    case ForecastFinding::Severity::Warning:
        return style->standardIcon(QStyle::SP_MessageBoxWarning);
    case ForecastFinding::Severity::Info:
        break;
    }
    return style->standardIcon(QStyle::SP_MessageBoxInformation);
}
