#pragma once

#include <QPluginLoader>
#include <QString>

class IPluginObjectBase;

// Loads a host plug-in file and checks that it is one: a Qt plug-in with the host's interface
// identifier, a "PluginID" in its metadata and an instance that implements IPluginObjectBase.
// The host owns the instance: it is deleted with the loader.
class PluginLoader
{
public:
    PluginLoader();
    ~PluginLoader();
    PluginLoader(const PluginLoader&) = delete;
    PluginLoader& operator=(const PluginLoader&) = delete;

    // On failure errorMessage gets one line naming the file, the reason and how to name another.
    bool load(const QString& fileName, QString* errorMessage);

    IPluginObjectBase* plugin() const { return m_plugin; }

    // $ALARMSEARCH_PLUGIN, else the plug-in in the installed plug-in folder, found relative to
    // the running executable's folder.
    static QString defaultPluginPath();

private:
    QString failure(const QString& reason) const;

    QString m_fileName;
    QPluginLoader m_loader;
    IPluginObjectBase* m_plugin = nullptr;
};
