#pragma once

#include "forecast/LoginForecast.h"

#include <QIcon>

// The icons of the forecast wherever the window shows it: the login check
// dock and "Try login".
QIcon forecastStatusIcon(ForecastStatus status);
QIcon severityIcon(ForecastFinding::Severity severity);
