#pragma once

#include <QLoggingCategory>

// The simulated server's log category, "alarmsearch.sim": clients dropped or refused, database
// failures. Its lines read "alarmsearch.sim: <message>" under Qt's default message pattern.
Q_DECLARE_LOGGING_CATEGORY(lcSim)
