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

/// Reads one list file and appends its "filelist" entries, in order, to `out`. False when the
/// file cannot be loaded (the reader has reported why; nothing is appended then).
bool loadInputList(const std::string &file, std::vector<std::string> &out);

}  // namespace ox
