#include "platform/PlugInTable.h"

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return nullptr; }
