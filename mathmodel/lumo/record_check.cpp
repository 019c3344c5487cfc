#include "record_check.h"

#include <cmath>

#include "runtime.h"

namespace lumo {

std::string FieldProblem(const std::string& osField, double dfValue, const std::string& osProblem) {
    return osField + " = " + nova::FormatString("%.15g", dfValue) + ": " + osProblem;
}

std::string FirstNonFinite(const char* pszField, const double* padfValues, int nCount) {
    for (int i = 0; i < nCount; ++i) {
        if (!std::isfinite(padfValues[i])) {
            return FieldProblem(std::string(pszField) + "[" + std::to_string(i) + "]",
                                padfValues[i], "must be a finite number");
        }
    }
    return "";
}

}  // namespace lumo
