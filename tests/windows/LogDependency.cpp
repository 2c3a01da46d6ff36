// A DLL that the second build of the logging library needs (see DependentLibrary.cpp).
extern "C" __declspec(dllexport) int logDependency() {
    return 1;
}
