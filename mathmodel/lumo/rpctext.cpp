// RPC00B text forms of a rational function model: the "KEY: value" lines of
// *_RPC.TXT files, the "name = value;" statements of .RPB files and the
// fixed-width record of RPC-*.txt files. All carry ten normalisation values
// and four lists of 20 coefficients, with longitude, latitude and height on
// the ground side and line and sample on the image side. RPC sample and line
// 0 are the centre of the first pixel, which is what the model's half-pixel
// shift expresses. Every other field of a text (error estimates, names) is
// handed back beside the record, so conversions keep it.
#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "lumo_rf.h"
#include "projection.h"
#include "rpctext_internal.h"
#include "runtime.h"

using namespace lumo::rpctext;  // NOLINT(google-build-using-namespace)

namespace {

// ---------------------------------------------------------------------------
// Record
// ---------------------------------------------------------------------------

// The record when it can be evaluated; else it is released and the reason
// thrown, naming the record field.
RFInfo_t* CheckedRecord(RFInfo_t* psRF, const std::string& osSource) {
    const std::string osProblem = RFValidate(psRF);
    if (osProblem.empty()) return psRF;
    RFDeallocate(psRF);
    RPC_FAIL(osSource + ": the model cannot be evaluated: " + osProblem);
}

RFInfo_t* ValuesToRecord(const RpcValues& values) {
    std::unique_ptr<RFInfo_t, void (*)(RFInfo_t*)> psRF(RFAllocate(nullptr, RF_MAX_TERMS),
                                                        &RFDeallocate);
    psRF->dfXOffset = values.adfScalar[kLongOff];
    psRF->dfXScale = values.adfScalar[kLongScale];
    psRF->dfYOffset = values.adfScalar[kLatOff];
    psRF->dfYScale = values.adfScalar[kLatScale];
    psRF->dfZOffset = values.adfScalar[kHeightOff];
    psRF->dfZScale = values.adfScalar[kHeightScale];
    psRF->dfPixelOffset = values.adfScalar[kSampOff];
    psRF->dfPixelScale = values.adfScalar[kSampScale];
    psRF->dfLineOffset = values.adfScalar[kLineOff];
    psRF->dfLineScale = values.adfScalar[kLineScale];
    for (int i = 0; i < RF_MAX_TERMS; ++i) {
        psRF->padfPixelNum[i] = values.aadfCoeff[kSampNum][i];
        psRF->padfPixelDen[i] = values.aadfCoeff[kSampDen][i];
        psRF->padfLineNum[i] = values.aadfCoeff[kLineNum][i];
        psRF->padfLineDen[i] = values.aadfCoeff[kLineDen][i];
    }
    // The sensor buffer holds 16 characters; a longer name is cut.
    const std::size_t nCopy = std::min<std::size_t>(values.osSensor.size(), RF_TEXT_SIZE - 1);
    std::memcpy(psRF->pszSensor, values.osSensor.data(), nCopy);
    psRF->pszSensor[nCopy] = '\0';
    return psRF.release();
}

#define RPC_REFUSE(message)                                                                 \
    throw nova::DataException(std::string("cannot write RPC text: ") + (message), __FILE__, \
                              __func__, __LINE__)

std::string BoundedText(const char* pszText) {
    if (pszText == nullptr) return std::string();
    return std::string(pszText, strnlen(pszText, RF_TEXT_SIZE - 1));
}

void CheckFinite(double dfValue, const char* pszField) {
    if (!std::isfinite(dfValue)) {
        RPC_REFUSE(std::string(pszField) + " = " + nova::FormatString("%g", dfValue) +
                   " is not finite");
    }
}

// True when the pixel and line share one denominator over the terms in use.
bool SameDenominators(const RFInfo_t* psRF) {
    for (int i = 0; i < psRF->nTerms; ++i) {
        if (psRF->padfPixelDen[i] != psRF->padfLineDen[i]) return false;
    }
    return true;
}

// Folds an image-space adjustment in force into the RPC values. With the
// rational functions' p = SampOff + SampScale Np/Dp (and l likewise), an
// affine adjustment pixel = a0 + (1 + a1) p + a2 l is again a rational
// function: a new offset and, without the cross term a2, a new scale. The
// cross term adds l's Nl/Dl to the pixel's numerator, which needs the line's
// denominator to be the pixel's. The adjustment's constant carries the
// half-pixel shift while RPC positions are centre-based, hence the 0.5.
// Second-order terms have no rational equivalent of third degree.
void FoldAdjustment(const RFInfo_t* psRF, RpcValues& values) {
    const double* a = psRF->adfPixelAdjust;
    const double* b = psRF->adfLineAdjust;
    for (int k = 3; k < RF_ADJUST_TERMS; ++k) {
        if (a[k] != 0.0 || b[k] != 0.0) {
            RPC_REFUSE("the second-order image-space adjustment has no RPC equivalent");
        }
    }
    const bool bCross = a[2] != 0.0 || b[1] != 0.0;
    if (bCross && !SameDenominators(psRF)) {
        RPC_REFUSE(
            "the image-space adjustment mixes pixel and line while their denominators "
            "differ: no RPC equivalent");
    }
    const double Op = psRF->dfPixelOffset, Sp = psRF->dfPixelScale;
    const double Ol = psRF->dfLineOffset, Sl = psRF->dfLineScale;
    values.adfScalar[kSampOff] = (1.0 + a[1]) * Op + a[2] * Ol + a[0] - 0.5;
    values.adfScalar[kLineOff] = b[1] * Op + (1.0 + b[2]) * Ol + b[0] - 0.5;
    if (!bCross) {
        values.adfScalar[kSampScale] = (1.0 + a[1]) * Sp;
        values.adfScalar[kLineScale] = (1.0 + b[2]) * Sl;
        return;
    }
    auto& sampNum = values.aadfCoeff[kSampNum];
    auto& lineNum = values.aadfCoeff[kLineNum];
    for (int i = 0; i < std::max(psRF->nTerms, 0); ++i) {
        const double dfPixelPart = Sp * psRF->padfPixelNum[i];
        const double dfLinePart = Sl * psRF->padfLineNum[i];
        sampNum[i] = ((1.0 + a[1]) * dfPixelPart + a[2] * dfLinePart) / Sp;
        lineNum[i] = (b[1] * dfPixelPart + (1.0 + b[2]) * dfLinePart) / Sl;
    }
}

// The record as RPC values; refuses what the text forms cannot express.
RpcValues RecordToValues(const RFInfo_t* psRF) {
    if (psRF == nullptr || psRF->padfPixelNum == nullptr || psRF->padfPixelDen == nullptr ||
        psRF->padfLineNum == nullptr || psRF->padfLineDen == nullptr) {
        RPC_REFUSE("the model or its coefficient arrays are null");
    }
    if (psRF->nTerms > RF_MAX_TERMS) {
        RPC_REFUSE("nTerms = " + std::to_string(psRF->nTerms) + " exceeds 20");
    }
    const std::string osGeosys = BoundedText(psRF->pszGeosys);
    if (DecodeGeosys(osGeosys.c_str(), nullptr) != NOVA_PROJ_GEOGRAPHIC) {
        RPC_REFUSE("ground coordinates \"" + osGeosys + "\" are not longitude and latitude");
    }
    RpcValues values;
    // Without the half-pixel shift the model's pixel 0 is the first pixel's
    // centre already; RPC positions are centre-based, so move the offsets.
    const double dfShift = psRF->nHalfPixelShift ? 0.0 : -0.5;
    values.adfScalar[kLongOff] = psRF->dfXOffset;
    values.adfScalar[kLongScale] = psRF->dfXScale;
    values.adfScalar[kLatOff] = psRF->dfYOffset;
    values.adfScalar[kLatScale] = psRF->dfYScale;
    values.adfScalar[kHeightOff] = psRF->dfZOffset;
    values.adfScalar[kHeightScale] = psRF->dfZScale;
    values.adfScalar[kSampOff] = psRF->dfPixelOffset + dfShift;
    values.adfScalar[kSampScale] = psRF->dfPixelScale;
    values.adfScalar[kLineOff] = psRF->dfLineOffset + dfShift;
    values.adfScalar[kLineScale] = psRF->dfLineScale;
    // Terms beyond nTerms do not take part in the model: written as 0.
    const int nTerms = std::max(psRF->nTerms, 0);
    for (int i = 0; i < nTerms; ++i) {
        values.aadfCoeff[kSampNum][i] = psRF->padfPixelNum[i];
        values.aadfCoeff[kSampDen][i] = psRF->padfPixelDen[i];
        values.aadfCoeff[kLineNum][i] = psRF->padfLineNum[i];
        values.aadfCoeff[kLineDen][i] = psRF->padfLineDen[i];
    }
    if (psRF->nAdjust) FoldAdjustment(psRF, values);
    for (int k = 0; k < kScalarCount; ++k) {
        CheckFinite(values.adfScalar[k], kTxtScalarKeys[k]);
        if (k >= kLineScale && values.adfScalar[k] == 0.0) {
            RPC_REFUSE(std::string(kTxtScalarKeys[k]) + " is 0");
        }
    }
    for (int i = 0; i < nTerms; ++i) {
        for (int nList = 0; nList < kListCount; ++nList) {
            CheckFinite(values.aadfCoeff[nList][i], kTxtListPrefixes[nList]);
        }
    }
    values.osSensor = BoundedText(psRF->pszSensor);
    return values;
}

// Shortest "%g" form that reads back to the same double, with its sign.
std::string ExactNumber(double dfValue) {
    for (int nDigits = 15; nDigits <= 17; ++nDigits) {
        std::string osText = nova::FormatString("%+.*g", nDigits, dfValue);
        if (std::strtod(osText.c_str(), nullptr) == dfValue) return osText;
    }
    return nova::FormatString("%+.17g", dfValue);
}

std::string Coefficient(double dfValue) {
    return nova::FormatString("%+.16E", dfValue);
}

// The spelling of a field's key in one form: the error estimates have one
// name per form, other keys are written as read.
std::string KeyInForm(const LumoRPCField& sField, bool bTxt) {
    for (const FieldSpelling& sSpelling : kFieldSpellings) {
        if (EqualNoCase(sField.osKey, sSpelling.pszTxt) ||
            EqualNoCase(sField.osKey, sSpelling.pszRpb)) {
            return bTxt ? sSpelling.pszTxt : sSpelling.pszRpb;
        }
    }
    return sField.osKey;
}

bool IsErrorEstimate(const LumoRPCField& sField) {
    return KeyInForm(sField, true) != KeyInForm(sField, false);
}

// A key that names a model value of either form, which a field must not take.
bool IsModelKey(const std::string& osKey) {
    for (int k = 0; k < kScalarCount; ++k) {
        if (EqualNoCase(osKey, kTxtScalarKeys[k]) || EqualNoCase(osKey, kRpbScalarKeys[k])) {
            return true;
        }
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        if (StartsWithNoCase(osKey, kTxtListPrefixes[nList]) ||
            EqualNoCase(osKey, kRpbListKeys[nList])) {
            return true;
        }
    }
    return false;
}

// A field the form can write so that reading it back gives it again.
void CheckField(const LumoRPCField& sField, bool bTxt) {
    const char* pszKeyStops = bTxt ? ":\r\n" : "=;()\"\r\n\t ";
    const char* pszValueStops = bTxt ? "\r\n" : sField.bQuoted ? "\"\r\n" : ";\"\r\n";
    const bool bOpenList = !bTxt && !sField.bQuoted && !StatementComplete(sField.osValue + " ");
    if (sField.osKey.empty() || Trim(sField.osKey) != sField.osKey || bOpenList ||
        sField.osKey.find_first_of(pszKeyStops) != std::string::npos ||
        sField.osValue.find_first_of(pszValueStops) != std::string::npos ||
        IsModelKey(sField.osKey)) {
        RPC_REFUSE("the field " + Shown(sField.osKey) + " = " + Shown(sField.osValue) +
                   " cannot be written in the " + (bTxt ? "\"KEY: value\"" : "\"name = value;\"") +
                   " form");
    }
}

std::string WriteTxt(const RpcValues& values, const std::vector<LumoRPCField>& aoFields) {
    std::string osText;
    for (const LumoRPCField& sField : aoFields) {
        CheckField(sField, true);
        osText += KeyInForm(sField, true) + ": " + sField.osValue +
                  (IsErrorEstimate(sField) ? " meters" : "") + "\n";
    }
    for (int k = 0; k < kScalarCount; ++k) {
        osText += std::string(kTxtScalarKeys[k]) + ": " + ExactNumber(values.adfScalar[k]) + " " +
                  kUnits[k] + "\n";
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            osText += kTxtListPrefixes[nList] + std::to_string(i + 1) + ": " +
                      Coefficient(values.aadfCoeff[nList][i]) + "\n";
        }
    }
    return osText;
}

std::string Statement(const LumoRPCField& sField, const char* pszIndent) {
    CheckField(sField, false);
    const std::string osValue = sField.bQuoted ? "\"" + sField.osValue + "\"" : sField.osValue;
    return pszIndent + KeyInForm(sField, false) + " = " + osValue + ";\n";
}

bool HasField(const std::vector<LumoRPCField>& aoFields, const char* pszKey) {
    return std::any_of(aoFields.begin(), aoFields.end(),
                       [pszKey](const LumoRPCField& f) { return EqualNoCase(f.osKey, pszKey); });
}

// Names (quoted fields) head the text; numbers such as the error estimates
// go inside the image group.
std::string WriteRpb(const RpcValues& values, const std::vector<LumoRPCField>& aoFields) {
    std::string osText;
    // A sensor name with a quote or a line end cannot be written in the form.
    bool bPlainSensor = !values.osSensor.empty() && !HasField(aoFields, "satId");
    for (char ch : values.osSensor) bPlainSensor = bPlainSensor && ch != '"' && ch >= ' ';
    if (bPlainSensor) osText += "satId = \"" + values.osSensor + "\";\n";
    for (const LumoRPCField& sField : aoFields) {
        if (sField.bQuoted) osText += Statement(sField, "");
    }
    if (!HasField(aoFields, "SpecId")) osText += "SpecId = \"RPC00B\";\n";
    osText += "BEGIN_GROUP = IMAGE\n";
    for (const LumoRPCField& sField : aoFields) {
        if (!sField.bQuoted) osText += Statement(sField, "\t");
    }
    for (int k = 0; k < kScalarCount; ++k) {
        osText += std::string("\t") + kRpbScalarKeys[k] + " = " + ExactNumber(values.adfScalar[k]) +
                  ";\n";
    }
    for (int nList = 0; nList < kListCount; ++nList) {
        osText += std::string("\t") + kRpbListKeys[nList] + " = (";
        for (int i = 0; i < RF_MAX_TERMS; ++i) {
            osText += "\n\t\t\t" + Coefficient(values.aadfCoeff[nList][i]) +
                      (i + 1 < RF_MAX_TERMS ? "," : ");\n");
        }
    }
    osText += "END_GROUP = IMAGE\nEND;\n";
    return osText;
}

}  // namespace

int LumoDetectRPCTextForm(const char* pszText, std::size_t nLength) {
    if (pszText == nullptr) return LUMO_RPC_TEXT_AUTO;
    const std::string osText(pszText, nLength);
    if (LooksFixed(FixedRecord(osText))) return LUMO_RPC_TEXT_FIXED;
    for (const std::string& osRaw : SplitLines(osText)) {
        const std::string osLine = Trim(osRaw);
        if (osLine.empty()) continue;
        const std::size_t nColon = osLine.find(':');
        const std::size_t nEquals = osLine.find('=');
        if (nColon != std::string::npos && nColon < nEquals) return LUMO_RPC_TEXT_TXT;
        if (nEquals != std::string::npos) return LUMO_RPC_TEXT_RPB;
        return LUMO_RPC_TEXT_AUTO;
    }
    return LUMO_RPC_TEXT_AUTO;
}

RFInfo_t* LumoRPCTextToRFInfo(const char* pszText, std::size_t nLength, int nForm,
                              const char* pszSource, std::vector<LumoRPCField>* paoFields) {
    const std::string osSource = pszSource != nullptr ? pszSource : "RPC text";
    if (pszText == nullptr) RPC_FAIL(osSource + ": no text");
    if (nForm == LUMO_RPC_TEXT_AUTO) nForm = LumoDetectRPCTextForm(pszText, nLength);
    const std::string osText(pszText, nLength);
    RpcValues values;
    switch (nForm) {
        case LUMO_RPC_TEXT_TXT:
            values = ReadTxt(osText, osSource);
            break;
        case LUMO_RPC_TEXT_RPB:
            values = ReadRpb(osText, osSource);
            break;
        case LUMO_RPC_TEXT_FIXED:
            values = ReadFixed(osText, osSource);
            break;
        default:
            RPC_FAIL(osSource +
                     ": not RPC text (neither \"KEY: value\" lines, \"name = value;\" "
                     "statements nor a fixed-width record)");
    }
    RFInfo_t* psRF = CheckedRecord(ValuesToRecord(values), osSource);
    if (paoFields != nullptr) *paoFields = std::move(values.aoFields);
    return psRF;
}

std::string LumoRFInfoToRPCText(const RFInfo_t* psRF, int nForm,
                                const std::vector<LumoRPCField>& aoFields) {
    const RpcValues values = RecordToValues(psRF);
    switch (nForm) {
        case LUMO_RPC_TEXT_TXT:
            return WriteTxt(values, aoFields);
        case LUMO_RPC_TEXT_RPB:
            return WriteRpb(values, aoFields);
        default:
            RPC_REFUSE("unknown text form " + std::to_string(nForm) +
                       " (the fixed-width form is read only)");
    }
}
