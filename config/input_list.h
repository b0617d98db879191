#pragma once

#include <string>
#include <vector>

#include "config/type.h"

/// Input list files: XML documents that name further input files.
namespace ox {

/// The settings object of an input list file (type "inputspecification"): one string vector.
class InputSpecificationBase : public OXCComplexType {
public:
    InputSpecificationBase() : OXCComplexType("inputspecification") {}

    /// The listed file names, in order.
    OXCTypedVector<std::string> filelist{this, "filelist", "Input files"};
};
/// The concrete input list object.
using InputSpecification = OXCComplexTypeInstantiator<InputSpecificationBase>;

/// Appends the files named by each list file, list files in the given order, to `out`. A list
/// that cannot be loaded prints "Unable to load input file list from file: " + its name and
/// makes the whole expansion fail (nothing is appended then).
bool expandInputLists(const std::vector<std::string> &listFiles, std::vector<std::string> &out);

}  // namespace ox
