// Pieces shared by the families' record validations: each validation
// returns why a record cannot be evaluated, as one text naming the record
// field and its value, or an empty text when the record is usable.
#pragma once

#include <string>

namespace lumo {

// "pszField = value: problem".
std::string FieldProblem(const std::string& osField, double dfValue, const std::string& osProblem);

// The first of nCount values that is not finite, named "pszField[i]"; empty
// when all are finite.
std::string FirstNonFinite(const char* pszField, const double* padfValues, int nCount);

}  // namespace lumo
