// Not by its header, which promises that it does not throw.
extern "C" const void* appsyncPlugInTable();
extern "C" const void* appsyncPlugInTable() { throw 7; }
