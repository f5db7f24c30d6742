#include <dlfcn.h>
#include <sys/wait.h>
#include <unistd.h>

#include "soak/failure.h"
#include "soak/message.h"
#include "soak/operations.h"
#include "tavo_osal/dl.h"
#include "tavo_osal/file.h"
#include "tavo_osal/process.h"
#include "tavo_osal/thread.h"

namespace tavo::soak {

void use_file(Client& client) {
    const std::string path = client.own_path("file");
    const unsigned size = client.random.between(1, 20000);
    Bytes bytes(size);
    const uint64_t seed = client.random.next();
    fill(seed, bytes.data(), size);
    FILE* file = tavo_osal_fopen(path.c_str(), "w+");
    if (!expect(file != nullptr, "tavo_osal_fopen: no file")) return;
    expect(tavo_osal_fwrite(bytes.data(), 1, size, file) == size, "tavo_osal_fwrite wrote less");
    fflush(file);
    expect(tavo_osal_get_file_size(path.c_str()) == static_cast<TAVO_INT64>(size), "a file's size is wrong");
    rewind(file);
    Bytes back(size + 1);
    expect(tavo_osal_fread(back.data(), 1, size + 1, file) == size, "tavo_osal_fread read another count");
    expect(first_difference(seed, back.data(), size) == size, "a file's contents are damaged");
    expect(tavo_osal_feof(file) != 0 && tavo_osal_feof(file) == 0, "the end of the file is told wrongly");
    rewind(file);
    expect(ftruncate(fileno(file), 0) == 0 && tavo_osal_fprintf(file, "%u of %s\n", size, "soak") > 0,
           "no line written");
    rewind(file);
    unsigned number = 0;
    char word[10] = "", line[40] = "";
    expect(tavo_osal_fscanf(file, "%u of %9s", &number, word) == 2 && number == size, "tavo_osal_fscanf read wrongly");
    rewind(file);
    expect(tavo_osal_fgets(line, sizeof line, file) != nullptr && std::to_string(size) + " of soak\n" == line,
           "tavo_osal_fgets read wrongly");
    expect(tavo_osal_ferror(file) == 0 && tavo_osal_fclose(file) == 0, "a file did not close well");
    expect(tavo_osal_file_check_existence(path.c_str()) == 1, "a file is missing");
    unlink(path.c_str());
    expect(tavo_osal_file_check_existence(path.c_str()) == 0 && tavo_osal_get_file_size(path.c_str()) == -1,
           "a file that was removed is there");
}

void run_program(Client& client) {
    const unsigned wanted = client.random.below(100);
    const int status = tavo_osal_system_call(("exit " + std::to_string(wanted)).c_str());
    expect(WIFEXITED(status) && WEXITSTATUS(status) == static_cast<int>(wanted), "a command's status is wrong");
    const std::string path = client.own_path("made");
    std::string command = "echo > '" + path + "'", shell = "sh", option = "-c";
    if (succeeds(tavo_osal_exec("/bin/sh", shell.data(), option.data(), command.data(), nullptr), "tavo_osal_exec")) {
        // A program that never runs is a client without progress.
        while (access(path.c_str(), F_OK) != 0) tavo_osal_thread_msleep(1);
    }
    unlink(path.c_str());
    expect(tavo_osal_wait(0) == 0, "tavo_osal_wait");
    expect(tavo_osal_misc_math_ceil(static_cast<float>(wanted) + 0.25F) == wanted + 1, "rounding up went wrong");
}

void load_object(Client&) {
    void* handle = nullptr;
    void* address = nullptr;
    if (!succeeds(tavo_osal_dlopen(SOAK_OBJECT, RTLD_NOW, &handle), "tavo_osal_dlopen")) return;
    if (succeeds(tavo_osal_dlsym(handle, "tavo_fixture_answer", &address), "tavo_osal_dlsym")) {
        expect(reinterpret_cast<int (*)()>(address)() == 42, "a loaded function answers wrongly");
    }
    expect_status(tavo_osal_dlsym(handle, "not_there", &address), TAVO_DL_SYMBOL_FAILED, "a symbol that is not there");
    succeeds(tavo_osal_dlclose(handle), "tavo_osal_dlclose");
    expect_status(tavo_osal_dlopen("/not/there.so", RTLD_NOW, &handle), TAVO_DL_OPEN_FAILED,
                  "an object that is not there");
}

}  // namespace tavo::soak
