#pragma once

#include <string>

namespace support {

/** Names the tests of a table after the field `name` of its rows. */
struct NameOfRow {
    template <typename Info>
    std::string operator()(const Info& info) const {
        return info.param.name;
    }
};

} // namespace support
