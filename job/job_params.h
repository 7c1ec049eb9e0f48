#pragma once

#include <memory>
#include <string>

#include <json/value.h>

namespace MARU {
namespace Backup {

/**
 * The parameters of a job, an object. Those that came over the wire are kept as
 * their JSON text: a waiting job costs little more than its bytes, and is written
 * without being taken apart. Those that are set one by one are kept as a value,
 * and so are those that their text would not bring back exactly.
 */
class JobParams {
public:
    /** No parameters. */
    JobParams() = default;
    JobParams(const JobParams& other);
    JobParams& operator=(const JobParams& other);

    /** Takes over all members of `object`, in place of what was there. */
    void assign(const Json::Value& object);
    void set(const std::string& name, const Json::Value& value);

    bool has(const std::string& name) const;
    /** False, with `value` untouched, if there is none of that name. */
    bool get(const std::string& name, Json::Value& value) const;
    Json::Value all() const;
    /** Writes the text of all behind `out`. */
    void appendTo(std::string& out) const;

private:
    std::string text = "{}"; ///< counts while there is no value
    std::unique_ptr<Json::Value> value;
};

} // namespace Backup
} // namespace MARU
