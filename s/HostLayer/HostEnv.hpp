// The one place that reads environment variables. A host whose own layer provides this class links
// that layer instead of HostEnv.cpp.

#ifndef OBR_HOSTLAYER_HOSTENV_HPP
#define OBR_HOSTLAYER_HOSTENV_HPP

// Visible, since another library may define it.
class __attribute__((visibility("default"))) Host_Env {
public:
    // The value of the variable, which may be empty, or null if it is not set.
    static const char* GetEnv(const char* name);
};

#endif
