#include "NotificationCenter.h"

uint64_t NotificationCenter::addObserver(const std::string& name, Observer observer) {
    std::lock_guard<std::mutex> lock(_mutex);
    uint64_t token = _nextToken++;
    _observers.push_back({token, name, std::move(observer)});
    return token;
}

void NotificationCenter::removeObserver(uint64_t token) {
    std::lock_guard<std::mutex> lock(_mutex);
    std::erase_if(_observers, [token](const Entry& e) { return e.token == token; });
}

void NotificationCenter::postNotificationName(const std::string& name, const Value& object, const Value& userInfo) {
    std::vector<Observer> matching;
    {
        std::lock_guard<std::mutex> lock(_mutex);
        for (const auto& e : _observers)
            if (e.name.empty() || e.name == name) matching.push_back(e.observer);
    }
    // Observers run outside the lock so they may post or unregister.
    Notification n{name, object, userInfo};
    for (const auto& o : matching) o(n);
}
