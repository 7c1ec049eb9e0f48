#pragma once

#include <random>
#include <string>

#include <json/value.h>

namespace support {

/** Makes JSON values of every kind, the same ones for the same seed. */
class RandomJson {
public:
    explicit RandomJson(unsigned int seed) : random(seed) {
    }

    /** A value with at most so many levels of arrays and objects. */
    Json::Value value(int levels);
    /** An object with at most so many levels, itself included. */
    Json::Value object(int levels);
    /** A text of up to a dozen bytes, with those that are escaped among them. */
    std::string text();
    /** A number below `limit`. */
    unsigned int below(unsigned int limit);

private:
    Json::Value number();
    Json::Value array(int levels);

    std::mt19937 random;
};

} // namespace support
