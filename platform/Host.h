#pragma once

namespace platform {

class AlarmEvent;
class EventStream;
class Files;
class KernelChannel;
class MainRunLoop;
class ManagedSettings;
class ProcessTransactions;
class ServiceRegistry;
class SystemLog;

/// One of each interface: what a host gives to a program. Nothing is owned; the host outlives the
/// programs' use of it.
struct Host {
    SystemLog& log;
    ServiceRegistry& registry;
    KernelChannel& channel;
    EventStream& events;
    AlarmEvent& alarms;
    ProcessTransactions& transactions;
    MainRunLoop& runLoop;
    ManagedSettings& settings;
    Files& files;
};

} // namespace platform
