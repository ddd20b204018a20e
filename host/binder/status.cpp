// Host stand-in for the NDK binder's AStatus: what a call reports, and its
// description for the log. Any thread; one status is read by one owner.
#include <stdlib.h>
#include <string.h>

#include <string>

#include <android/binder_status.h>

struct AStatus {
    binder_exception_t exception = EX_NONE;
    binder_status_t status = STATUS_OK;  // for EX_TRANSACTION_FAILED
    int32_t serviceSpecific = 0;         // for EX_SERVICE_SPECIFIC
    std::string message;
};

namespace {

struct Name {
    int32_t value;
    const char* name;
};

// Codes not listed here are pruned, as the platform does, so a caller never sees one it cannot name.
const Name kExceptions[] = {
        {EX_NONE, "EX_NONE"},
        {EX_SECURITY, "EX_SECURITY"},
        {EX_BAD_PARCELABLE, "EX_BAD_PARCELABLE"},
        {EX_ILLEGAL_ARGUMENT, "EX_ILLEGAL_ARGUMENT"},
        {EX_NULL_POINTER, "EX_NULL_POINTER"},
        {EX_ILLEGAL_STATE, "EX_ILLEGAL_STATE"},
        {EX_NETWORK_MAIN_THREAD, "EX_NETWORK_MAIN_THREAD"},
        {EX_UNSUPPORTED_OPERATION, "EX_UNSUPPORTED_OPERATION"},
        {EX_SERVICE_SPECIFIC, "EX_SERVICE_SPECIFIC"},
        {EX_PARCELABLE, "EX_PARCELABLE"},
        {EX_TRANSACTION_FAILED, "EX_TRANSACTION_FAILED"},
        {0, nullptr},
};

const Name kStatuses[] = {
        {STATUS_OK, "STATUS_OK"},
        {STATUS_UNKNOWN_ERROR, "STATUS_UNKNOWN_ERROR"},
        {STATUS_NO_MEMORY, "STATUS_NO_MEMORY"},
        {STATUS_INVALID_OPERATION, "STATUS_INVALID_OPERATION"},
        {STATUS_BAD_VALUE, "STATUS_BAD_VALUE"},
        {STATUS_BAD_TYPE, "STATUS_BAD_TYPE"},
        {STATUS_NAME_NOT_FOUND, "STATUS_NAME_NOT_FOUND"},
        {STATUS_PERMISSION_DENIED, "STATUS_PERMISSION_DENIED"},
        {STATUS_NO_INIT, "STATUS_NO_INIT"},
        {STATUS_ALREADY_EXISTS, "STATUS_ALREADY_EXISTS"},
        {STATUS_DEAD_OBJECT, "STATUS_DEAD_OBJECT"},
        {STATUS_FAILED_TRANSACTION, "STATUS_FAILED_TRANSACTION"},
        {STATUS_BAD_INDEX, "STATUS_BAD_INDEX"},
        {STATUS_NOT_ENOUGH_DATA, "STATUS_NOT_ENOUGH_DATA"},
        {STATUS_WOULD_BLOCK, "STATUS_WOULD_BLOCK"},
        {STATUS_TIMED_OUT, "STATUS_TIMED_OUT"},
        {STATUS_UNKNOWN_TRANSACTION, "STATUS_UNKNOWN_TRANSACTION"},
        {STATUS_FDS_NOT_ALLOWED, "STATUS_FDS_NOT_ALLOWED"},
        {STATUS_UNEXPECTED_NULL, "STATUS_UNEXPECTED_NULL"},
        {0, nullptr},
};

const char* nameOf(const Name* table, int32_t value) {
    for (; table->name != nullptr; ++table) {
        if (table->value == value) return table->name;
    }
    return nullptr;
}

AStatus* newStatus(binder_exception_t exception, binder_status_t status, int32_t serviceSpecific,
                   const char* message) {
    AStatus* s = new AStatus;
    s->exception = exception;
    s->status = status;
    s->serviceSpecific = serviceSpecific;
    if (message != nullptr) s->message = message;
    return s;
}

}  // namespace

AStatus* AStatus_newOk(void) { return newStatus(EX_NONE, STATUS_OK, 0, nullptr); }

AStatus* AStatus_fromExceptionCodeWithMessage(binder_exception_t exception, const char* message) {
    if (nameOf(kExceptions, exception) == nullptr) exception = EX_TRANSACTION_FAILED;
    binder_status_t status = exception == EX_TRANSACTION_FAILED ? STATUS_FAILED_TRANSACTION : STATUS_OK;
    return newStatus(exception, status, 0, message);
}

AStatus* AStatus_fromExceptionCode(binder_exception_t exception) {
    return AStatus_fromExceptionCodeWithMessage(exception, nullptr);
}

AStatus* AStatus_fromServiceSpecificErrorWithMessage(int32_t serviceSpecific, const char* message) {
    return newStatus(EX_SERVICE_SPECIFIC, STATUS_OK, serviceSpecific, message);
}

AStatus* AStatus_fromServiceSpecificError(int32_t serviceSpecific) {
    return AStatus_fromServiceSpecificErrorWithMessage(serviceSpecific, nullptr);
}

AStatus* AStatus_fromStatus(binder_status_t status) {
    if (status == STATUS_OK) return AStatus_newOk();
    if (nameOf(kStatuses, status) == nullptr) status = STATUS_UNKNOWN_ERROR;
    return newStatus(EX_TRANSACTION_FAILED, status, 0, nullptr);
}

bool AStatus_isOk(const AStatus* status) { return status->exception == EX_NONE; }

binder_exception_t AStatus_getExceptionCode(const AStatus* status) { return status->exception; }

int32_t AStatus_getServiceSpecificError(const AStatus* status) {
    return status->exception == EX_SERVICE_SPECIFIC ? status->serviceSpecific : 0;
}

binder_status_t AStatus_getStatus(const AStatus* status) {
    return status->exception == EX_TRANSACTION_FAILED ? status->status : STATUS_OK;
}

const char* AStatus_getMessage(const AStatus* status) { return status->message.c_str(); }

// "Status(-129, EX_TRANSACTION_FAILED): STATUS_DEAD_OBJECT: 'message'", or "No error".
const char* AStatus_getDescription(const AStatus* status) {
    std::string text = "No error";
    if (status->exception != EX_NONE) {
        text = "Status(" + std::to_string(status->exception) + ", " + nameOf(kExceptions, status->exception) + "): ";
        if (status->exception == EX_TRANSACTION_FAILED) text += std::string(nameOf(kStatuses, status->status)) + ": ";
        if (status->exception == EX_SERVICE_SPECIFIC) text += std::to_string(status->serviceSpecific) + ": ";
        text += "'" + status->message + "'";
    }
    return strdup(text.c_str());
}

void AStatus_deleteDescription(const char* description) { free(const_cast<char*>(description)); }

void AStatus_delete(AStatus* status) { delete status; }
