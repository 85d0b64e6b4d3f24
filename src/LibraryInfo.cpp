// The shared library is the union of the subsystem archives; this file gives it
// one object of its own and names the build for anyone who loads it.
extern "C" const char* tavoplayer_fullseg_version() {
    return "TavoPlayer fullseg 0.1";
}
