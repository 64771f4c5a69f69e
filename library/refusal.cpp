#include "library/refusal.h"

#include <cstdio>
#include <filesystem>
#include <new>
#include <system_error>

#include "host/base/param_text.h"
#include "host/media/clip.h"
#include "host/plugin/plugin_library.h"
#include "host/project/project_file.h"
#include "host/stabilize/failures.h"
#include "host/stabilize/framing.h"

namespace calmframe::library {

calmframe_result TellException(char* line, std::size_t size) noexcept {
  const auto tell = [&](calmframe_result code, const char* text) {
    std::snprintf(line, size, "%s", text);
    return code;
  };
  try {
    throw;
  } catch (const Refusal& refusal) {
    return tell(refusal.code, refusal.what());
  } catch (const std::bad_alloc&) {
    return tell(CALMFRAME_ERROR_MEMORY, "there is no memory");
  } catch (const ParamRefused& refused) {
    return tell(CALMFRAME_ERROR_ARGUMENT, refused.what());
  } catch (const host::WindowRefused& refused) {
    return tell(CALMFRAME_ERROR_ARGUMENT, refused.what());
  } catch (const host::Interrupted&) {
    return tell(CALMFRAME_ERROR_CANCELLED, "was cancelled");
  } catch (const host::BrokenPromise&) {
    return tell(CALMFRAME_ERROR_SOURCE, "the clip has other frames than it was opened with");
  } catch (const host::PluginError& error) {
    return tell(CALMFRAME_ERROR_PLUGIN, error.what());
  } catch (const host::SolveFailure& failure) {
    return tell(CALMFRAME_ERROR_SOLVE, failure.what());
  } catch (const host::ProjectFailure& failure) {
    return tell(CALMFRAME_ERROR_FILE, failure.what());
  } catch (const media::Failure& failure) {
    return tell(CALMFRAME_ERROR_SOURCE, failure.what());
  } catch (const std::filesystem::filesystem_error& error) {  // no folder for temporary files
    return tell(CALMFRAME_ERROR_FILE, error.what());
  } catch (const std::system_error& error) {  // a thread that can't be started
    return tell(CALMFRAME_ERROR_MEMORY, error.what());
  } catch (const std::exception& error) {
    return tell(CALMFRAME_ERROR_INTERNAL, error.what());
  } catch (...) {
    return tell(CALMFRAME_ERROR_INTERNAL, "an unknown failure");
  }
}

}  // namespace calmframe::library
