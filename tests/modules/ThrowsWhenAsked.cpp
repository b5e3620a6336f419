// Not by its header, which promises that it does not throw.
namespace appsync {
struct PlugInTable;
}
extern "C" const appsync::PlugInTable* appsyncPlugInTable();
const appsync::PlugInTable* appsyncPlugInTable() { throw 7; }
