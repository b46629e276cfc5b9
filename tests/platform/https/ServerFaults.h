#pragma once

namespace support {

/// What a server may do wrong, by the collector's word for it, and how requests end then.
struct ServerFault {
    const char* fault;
    /// Of a document of some megabytes: what befalls the body of its answer does not concern it.
    const char* ofAPost;
    const char* ofAGet;
    /// Whether a GET only ends by its limit of time.
    bool isSlow = false;
};

inline constexpr ServerFault kServerFaults[] = {
    {"reset-on-connect", "transport 2", "transport 2"},
    {"garbage-instead-of-tls", "transport 2", "transport 2"},
    {"reset-in-request", "transport 6", "transport 6"},
    {"hang-up", "transport 6", "transport 6"},
    {"garbage-instead-of-http", "transport 6", "transport 6"},
    {"huge-headers", "transport 5", "transport 5"},
    {"huge-header-line", "transport 6", "transport 6"},
    {"endless-headers", "transport 5", "transport 5"},
    {"endless-interim", "transport 5", "transport 5"},
    {"reset-in-response", "200", "transport 6"},
    {"hang-up-in-response", "200", "transport 6"},
    {"endless-body", "200", "transport 5"},
    {"byte-a-second-body", "200", "transport 3", true},
};

} // namespace support
