// The labels of the exhibits as readers see them: docs/damage.md. It is written here from what is
// said of the exhibits, and read back by the tests, which compare.
#pragma once

#include <map>
#include <string>

#include "exhibit.h"
#include "showing.h"

namespace VELK::test {

// An exhibit's entry in the document: what is hurt and what is said of it, without its heading.
std::string LabelOf(const Exhibit& exhibit, const Shown& shown);

// The whole document; shows every exhibit and takes its time.
std::string Document();

// The entries of the document at `path` by the names of the exhibits.
std::map<std::string, std::string> ReadLabels(const std::string& path);

}  // namespace VELK::test
