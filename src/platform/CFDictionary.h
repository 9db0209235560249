// A dictionary with an identity: a property-list dictionary that several
// owners share by reference and that a record can point at (the per-frame
// entries an ingest object hands the host stay alive while the frame's
// keeper holds this object).
#pragma once

#include "Object.h"
#include "Value.h"

class CFDictionary : public Object {
public:
    static Ref<CFDictionary> create(Dictionary dictionary = {}) {
        Ref<CFDictionary> d(new CFDictionary);
        d->_dictionary = std::move(dictionary);
        return d;
    }
    const Dictionary& dictionary() const { return _dictionary; }
    Dictionary& dictionary() { return _dictionary; }
    std::string description() const override { return Value(_dictionary).description(); }

private:
    CFDictionary() = default;
    Dictionary _dictionary;
};

using CFDictionaryRef = Ref<CFDictionary>;
