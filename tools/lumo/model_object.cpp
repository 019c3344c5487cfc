#include "model_object.h"

#include <string>

#include "cli_error.h"

namespace lumo::cli {
namespace {

using nova::mathmodel::IMathModel;
using nova::ogc::cs::DatumType;

// How each family becomes an object. A family joins orthorectification and
// rational polynomial fitting with one line here.
struct ObjectKind {
    int nModelCode;
    bool bModelObject;   // LumoMathModel wraps it; otherwise a record model
    DatumType eHeights;  // record models only: the heights the family uses
};

// Model objects take their heights from the record (the radar model's
// height reference, for instance); their entries' eHeights is not read.

constexpr ObjectKind kObjectKinds[] = {
    {LUMO_CODE_SRIT, true, nova::ogc::cs::CS_VD_Orthometric},
    {LUMO_CODE_POLY, true, nova::ogc::cs::CS_VD_Ellipsoidal},
    {LUMO_CODE_TPS, true, nova::ogc::cs::CS_VD_Ellipsoidal},
    {LUMO_CODE_AP, false, nova::ogc::cs::CS_VD_Orthometric},
    {LUMO_CODE_RF, false, nova::ogc::cs::CS_VD_Ellipsoidal},
    {LUMO_CODE_RTCS, true, nova::ogc::cs::CS_VD_Ellipsoidal},
    {LUMO_CODE_LRS, true, nova::ogc::cs::CS_VD_Ellipsoidal},
};

}  // namespace

std::unique_ptr<IMathModel> MakeModelObject(const LoadedModel& model) {
    for (const ObjectKind& kind : kObjectKinds) {
        if (kind.nModelCode != model.nModelCode) continue;
        if (kind.bModelObject) {
            return std::make_unique<nova::mathmodel::LumoMathModel>(model.nModelCode,
                                                                    model.poRecord.get());
        }
        ProjInfo_t projection{};
        EnvelopeToProjInfo(model.sEnvelope, &projection);
        return std::unique_ptr<IMathModel>(nova::mathmodel::CreateRecordMathModel(
            model.nModelCode, model.poRecord, projection, kind.eHeights, model.sEnvelope.nPixels,
            model.sEnvelope.nLines));
    }
    LUMO_CLI_FAIL(model.sEnvelope.osSource + ": " + Quoted(model.sEnvelope.osFamily) +
                  " models cannot be used for images yet");
}

std::unique_ptr<IMathModel> MakeRpcModelObject(std::shared_ptr<void> poRecord, int nPixels,
                                               int nLines) {
    ProjInfo_t projection{};
    Geosys2ProjInfo(&projection, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
    return std::unique_ptr<IMathModel>(
        nova::mathmodel::CreateRecordMathModel(LUMO_CODE_RF, std::move(poRecord), projection,
                                               nova::ogc::cs::CS_VD_Ellipsoidal, nPixels, nLines));
}

}  // namespace lumo::cli
