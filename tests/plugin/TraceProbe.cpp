#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"

#include <QCoreApplication>

#include <cstdio>

int main(int argc, char** argv)
{
    QCoreApplication app(argc, argv);
    FakeFrameworkTools tools;
    bool initialised = false;
    {
        PluginQuenvar plugin;
        initialised = plugin.InitialPluginBase(&tools);
    }
    std::printf("initialised=%d\n", initialised ? 1 : 0);
    return initialised ? 0 : 1;
}
