#include "PluginLoader.h"

#include <IPluginObjectBase.h>

#include <QCoreApplication>
#include <QFileInfo>
#include <QJsonObject>

namespace {

const char kPluginEnvironmentVariable[] = "ALARMSEARCH_PLUGIN";
const char kPluginFileName[] = "libPluginAlarmSearchSrv.so";

} // namespace

PluginLoader::PluginLoader() = default;

PluginLoader::~PluginLoader()
{
    delete m_plugin;
    if (m_loader.isLoaded())
        m_loader.unload();
}

QString PluginLoader::defaultPluginPath()
{
    QString fromEnvironment = qEnvironmentVariable(kPluginEnvironmentVariable);
    if (!fromEnvironment.isEmpty())
        return fromEnvironment;
    return QCoreApplication::applicationDirPath() +
           QLatin1String("/" ALARMSEARCH_PLUGIN_RELATIVE_DIR "/") + QLatin1String(kPluginFileName);
}

QString PluginLoader::failure(const QString& reason) const
{
    const QString detail = m_loader.errorString().simplified();
    return QStringLiteral("cannot load plug-in %1: %2 (%3); name the plug-in file with --plugin "
                          "or %4")
        .arg(m_fileName, reason, detail, QLatin1String(kPluginEnvironmentVariable));
}

bool PluginLoader::load(const QString& fileName, QString* errorMessage)
{
    m_fileName = fileName;
    m_loader.setFileName(QFileInfo(fileName).absoluteFilePath());
    const QJsonObject metaData = m_loader.metaData();
    if (!QFileInfo(fileName).isFile()) {
        *errorMessage = failure(QStringLiteral("no such file"));
        return false;
    }
    if (metaData.isEmpty()) {
        *errorMessage = failure(QStringLiteral("not a Qt plug-in"));
        return false;
    }
    const QString iid = metaData.value(QLatin1String("IID")).toString();
    if (iid != QLatin1String(PLUGINSERVER_PLUGIN_IID)) {
        *errorMessage = failure(QStringLiteral("interface identifier \"%1\", expected \"%2\"")
                                    .arg(iid, QLatin1String(PLUGINSERVER_PLUGIN_IID)));
        return false;
    }
    const QString pluginId = metaData.value(QLatin1String("MetaData"))
                                 .toObject()
                                 .value(QLatin1String("PluginID"))
                                 .toString();
    if (pluginId.isEmpty()) {
        *errorMessage = failure(QStringLiteral("no \"PluginID\" in its metadata"));
        return false;
    }
    QObject* instance = m_loader.instance();
    if (!instance) {
        *errorMessage = failure(QStringLiteral("no plug-in instance"));
        return false;
    }
    auto* plugin = qobject_cast<IPluginObjectBase*>(instance);
    if (!plugin) {
        *errorMessage = failure(QStringLiteral("instance of %1 is no IPluginObjectBase")
                                    .arg(QLatin1String(instance->metaObject()->className())));
        delete instance;
        return false;
    }
    m_plugin = plugin;
    return true;
}
