#pragma once

// Makes one later operator new throw std::bad_alloc, the exception that the plugin's own code can
// meet. Only allocations made directly by the plugin's module or Trindle's count, on the calling
// thread: Qt's own code is not written to let an exception pass, so failing its allocations would
// end the program rather than test it. Replaces the global operator new of the test program that
// links it.
class AllocationFault {
public:
    // The allocation after the next count ones fails.
    static void failAfter(int count);
    // Nothing fails any more; happened() still tells.
    static void disarm();
    // Whether the armed failure has happened since the last failAfter.
    static bool happened();
};
