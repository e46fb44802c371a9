// Setting a pair of a string hash (text_containers.h) from the host platform's own code, whose
// texts are not zero-terminated.

#ifndef ZELO_HOST_HASH_PLACE_H
#define ZELO_HOST_HASH_PLACE_H

#include <cstddef>
#include <string>
#include <string_view>

#include "text_containers.h"

namespace host {

struct PlaceInHash {
    std::size_t index;
    std::string &strValue;  // until the hash is released
};

// The place of the key; one that is not there comes last, with an empty value. Throws
// std::bad_alloc, with the hash as it was.
PlaceInHash FindOrAddKey(YLIBSZHASH &hash, std::string_view key);

}  // namespace host

#endif
