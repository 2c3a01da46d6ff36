// Linked into a second build of the logging library so that it needs LogDependency.dll, as a
// library may need DLLs of its own.
extern "C" __declspec(dllimport) int logDependency();

extern "C" __declspec(dllexport) int logDependencyValue() {
    return logDependency();
}
