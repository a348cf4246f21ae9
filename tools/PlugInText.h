// Plug-ins as people read them: a table of many, a page of one. Made from the forms that the daemon answers.
#pragma once

#include <string>
#include <vector>

#include "platform/value/Value.h"

namespace tools {

/// `forms` (dictionaries) ordered by identifier, then version (numbers inside it by value), then UUID.
std::vector<platform::Value> sortedForms(const platform::Value& forms);

/// One row a form, under a heading.
std::string plugInTable(const std::vector<platform::Value>& forms);

/// Every fact of one form that says something, one a line.
std::string plugInPage(const platform::Value& form);

}  // namespace tools
