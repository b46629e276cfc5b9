#pragma once

namespace platform {

class AlarmEvent;
class Clock;
class ConfigurationResource;
class EventStream;
class Files;
class HTTPSessions;
class InternalDiagnostics;
class JSON;
class KernelChannel;
class MainRunLoop;
class ManagedSettings;
class ProcessTransactions;
class PropertyLists;
class SerialQueues;
class ServiceRegistry;
class SystemLog;
class SystemVersion;
class UserDefaults;

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
    Clock& clock;
    PropertyLists& propertyLists;
    JSON& json;
    UserDefaults& defaults;
    ConfigurationResource& resources;
    SystemVersion& version;
    InternalDiagnostics& diagnostics;
    SerialQueues& queues;
    HTTPSessions& https;
};

} // namespace platform
