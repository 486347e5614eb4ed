// A simulated daemon is ended in the middle of its work, as a process is: nobody gives back what it holds then, a tap that still
// runs and all that waits for it. So the simulation isn't asked for leaks; the unit tests are.

#ifdef LC_SANITIZED
extern "C" const char* __asan_default_options();
extern "C" const char* __asan_default_options() { return "detect_leaks=0"; }
#endif
