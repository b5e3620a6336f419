#include "platform/PlugInTable.h"

extern "C" const appsync::PlugInTable* appsyncTableOfAnotherLibrary();

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return appsyncTableOfAnotherLibrary(); }
