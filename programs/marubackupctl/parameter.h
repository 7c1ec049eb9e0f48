#pragma once

#include <string>

#include <json/value.h>

/**
 * Reads "name=text" or "name:=json" into `parameters`; the first "=" in
 * `argument` says which it is, and a name that is there already is replaced. On
 * a mistake the result says what is wrong; otherwise it is empty.
 */
std::string readParameter(const std::string& argument, Json::Value& parameters);
