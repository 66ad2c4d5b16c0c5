// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/wire_form.h"

#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace OvraPlatform {

/// The fields of a form in their order, not yet escaped.
using FormFields = std::vector<std::pair<std::string, std::string>>;

/// std::nullopt if a parameter has the name of one of the form's own fields.
std::optional<FormFields> toFormFields(const WireCall &call);
std::string encodeForm(const FormFields &fields);

} // namespace OvraPlatform
