#pragma once

#include <string>

namespace MARU {
namespace Backup {

class CommandServer;

/**
 * Answers one request: `data` is `length` bytes of JSON text, the result the
 * text of the reply. No request, whatever it holds, makes it throw.
 */
std::string dispatchRequest(const char* data, unsigned int length, CommandServer* server);

} // namespace Backup
} // namespace MARU
