// Named notifications posted to registered observers, synchronously on the
// posting thread.
#pragma once

#include "Object.h"
#include "Value.h"

#include <functional>
#include <mutex>
#include <string>
#include <vector>

struct Notification {
    std::string name;
    Value object;
    Value userInfo;
};

class NotificationCenter : public Object {
public:
    using Observer = std::function<void(const Notification&)>;

    static Ref<NotificationCenter> notificationCenter() { return makeRef<NotificationCenter>(); }

    // An empty name observes every notification. Answers a token for removal.
    uint64_t addObserver(const std::string& name, Observer observer);
    void removeObserver(uint64_t token);

    void postNotificationName(const std::string& name, const Value& object, const Value& userInfo = Value());

private:
    struct Entry {
        uint64_t token;
        std::string name;
        Observer observer;
    };
    std::mutex _mutex;
    std::vector<Entry> _observers;
    uint64_t _nextToken = 1;
};
