#pragma once

// Includes shared by the plug-in's sources.

#include <PluginAlarmSearchCommon.h>

#include <QList>
#include <QMap>
#include <QSharedPointer>
#include <QString>
#include <QStringList>
#include <QVariant>

#include <functional>
