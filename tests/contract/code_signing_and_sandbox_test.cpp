// One suite for what the core asks about processes: who they are, whether they are confined, what they may
// read and what can be granted to them.

#include "../../platform/linux/testing/child_process.h"
#include "../../platform/linux/testing/scratch_folder.h"
#include "platform/linux/linux_code_signing.h"
#include "platform/linux/linux_sandbox.h"
#include "platform/simulated/simulated_code_signing.h"
#include "platform/simulated/simulated_sandbox.h"

#include <filesystem>

#include <fcntl.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles";
const std::string font = fontFiles + "/org.example.foundry/a.ttf";

/// What a test wants to know about.
struct Program {
    /// Null for one that nobody signed.
    std::optional<std::string> identifier;
    PropertyList::Dictionary entitlements;
    bool isSandboxed = false;
    /// Whether it can read the font by itself; unsandboxed programs always can.
    bool seesFonts = true;
};

/// Processes, and the services that are asked about them.
class World {
public:
    virtual ~World() = default;
    virtual CodeSigning& codeSigning() = 0;
    virtual Sandbox& sandbox() = 0;
    /// Starts a process; its number.
    virtual std::size_t start(const Program& program) = 0;
    virtual AuditToken token(std::size_t process) = 0;
    virtual void end(std::size_t process) = 0;
    /// Starts an unsandboxed process that becomes another program; its tokens before and after.
    virtual std::pair<AuditToken, AuditToken> becomeAnother(const Program& before, const Program& after) = 0;
};

class SimulatedWorld : public World {
public:
    CodeSigning& codeSigning() override { return codeSigning_; }
    Sandbox& sandbox() override { return sandbox_; }
    std::size_t start(const Program& program) override
    {
        tokens_.push_back(processes_.add(processOf(program)));
        return tokens_.size() - 1;
    }
    AuditToken token(std::size_t process) override { return tokens_.at(process); }
    void end(std::size_t process) override { processes_.exit(tokens_.at(process)); }
    std::pair<AuditToken, AuditToken> becomeAnother(const Program& before, const Program& after) override
    {
        const auto first = processes_.add(processOf(before));
        return {first, processes_.exec(first, processOf(after))};
    }

private:
    static SimulatedProcess processOf(const Program& program)
    {
        SimulatedProcess process{program.identifier, program.entitlements, program.isSandboxed, {}, true};
        if (program.seesFonts) {
            process.readablePaths = {font, fontFiles};
        }
        return process;
    }

    SimulatedProcesses processes_;
    SimulatedCodeSigning codeSigning_{processes_};
    SimulatedSandbox sandbox_{processes_};
    std::vector<AuditToken> tokens_;
};

class LinuxWorld : public World {
public:
    LinuxWorld()
    {
        folder_.write(font, "font");
        EXPECT_TRUE(writeTrustedKey(folder_.root, {key_.publicKey, {}}).value);
    }
    CodeSigning& codeSigning() override { return codeSigning_; }
    Sandbox& sandbox() override { return sandbox_; }
    std::size_t start(const Program& program) override
    {
        const auto file = fileOf(program);
        auto child = std::make_unique<testing::ChildProcess>(commandFor(program, file));
        child->waitForEcho();
        if (program.isSandboxed) {
            registerSandbox(*child, file);
        }
        children_.push_back(std::move(child));
        return children_.size() - 1;
    }
    AuditToken token(std::size_t process) override { return children_.at(process)->tokenInside(); }
    void end(std::size_t process) override { children_.at(process)->end(); }
    std::pair<AuditToken, AuditToken> becomeAnother(const Program&, const Program& after) override
    {
        children_.push_back(std::make_unique<testing::ChildProcess>(
            std::vector<std::string>{"/bin/sh", "-c", "echo 1; read a; exec " + fileOf(after)}));
        auto& child = *children_.back();
        EXPECT_EQ(child.read(), "1\n");
        const auto before = child.token();
        child.write("\n");
        child.waitForEcho();
        return {before, child.token()};
    }

private:
    std::string fileOf(const Program& program)
    {
        auto file = folder_.program("program" + std::to_string(++count_));
        if (program.identifier) {
            const CodeStatement statement{*program.identifier, program.entitlements, testing::digestOf(file)};
            EXPECT_TRUE(writeSignature(folder_.root, key_, statement).value);
        }
        return file;
    }
    std::vector<std::string> commandFor(const Program& program, const std::string& file) const
    {
        if (!program.isSandboxed) {
            return {file};
        }
        std::vector<std::string> command{"bwrap", "--ro-bind",         "/",
                                         "/",     "--die-with-parent", "--unshare-pid"};
        if (!program.seesFonts) {
            command.insert(command.end(), {"--tmpfs", folder_.root.real(fontFiles)});
        }
        command.push_back(file);
        return command;
    }
    void registerSandbox(const testing::ChildProcess& child, const std::string& file)
    {
        const auto self = openPidfd(::getpid());
        const FileDescriptor executable(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
        auto first = openPidfd(testing::ChildProcess::firstChildOf(child.pid()));
        const auto outcome =
            instances_.registerInstance(tokenOfProcess(self.get()), std::move(first), executable.get());
        EXPECT_EQ(outcome.refusal, SandboxInstances::Refusal::none) << outcome.explanation;
    }

    testing::ScratchFolder folder_;
    testing::RecordingLog log_;
    const SigningKey key_ = generateSigningKey();
    EventPool pool_;
    ConfinementProbe probe_;
    SignatureStore signatures_{folder_.root, log_};
    SandboxInstances instances_{probe_, signatures_, pool_};
    LinuxCodeSigning codeSigning_{probe_, instances_, signatures_};
    ExtensionTokens tokens_;
    LinuxSandbox sandbox_{probe_, tokens_, folder_.root};
    std::vector<std::unique_ptr<testing::ChildProcess>> children_;
    int count_ = 0;
};

using MakeWorld = std::unique_ptr<World> (*)();
template <class Kind>
std::unique_ptr<World> make()
{
    return std::make_unique<Kind>();
}

struct ProcessContract : ::testing::TestWithParam<std::pair<const char*, MakeWorld>> {
    const std::unique_ptr<World> world = GetParam().second();
    CodeSigning& codeSigning = world->codeSigning();
    Sandbox& sandbox = world->sandbox();
};

INSTANTIATE_TEST_SUITE_P(Platforms, ProcessContract,
                         ::testing::Values(std::pair("simulated", &make<SimulatedWorld>),
                                           std::pair("linux", &make<LinuxWorld>)),
                         [](const auto& kind) { return std::string(kind.param.first); });

TEST_P(ProcessContract, ASignedProgramHasItsIdentifierAndEntitlementsInAndOutOfSandboxes)
{
    for (const bool isSandboxed : {false, true}) {
        const auto process =
            world->start({"org.example.viewer", {{"a", PropertyList::Array{"b"}}}, isSandboxed});
        const auto task = codeSigning.taskFromAuditToken(world->token(process));
        ASSERT_TRUE(task);
        EXPECT_EQ(task->signingIdentifier, "org.example.viewer");
        EXPECT_EQ(task->entitlement("a"), PropertyList(PropertyList::Array{"b"}));
        EXPECT_EQ(task->entitlement("c"), std::nullopt);
    }
}

TEST_P(ProcessContract, AProgramWithoutSignatureIsThereWithoutIdentifierAndEntitlements)
{
    for (const bool isSandboxed : {false, true}) {
        const auto process = world->start({std::nullopt, {}, isSandboxed});
        const auto task = codeSigning.taskFromAuditToken(world->token(process));
        ASSERT_TRUE(task);
        EXPECT_EQ(task->signingIdentifier, std::nullopt);
        EXPECT_TRUE(task->entitlements.empty());
    }
}

TEST_P(ProcessContract, ProcessesInSandboxesAreSandboxed)
{
    EXPECT_FALSE(sandbox.isSandboxed(world->token(world->start({std::nullopt, {}, false}))));
    EXPECT_TRUE(sandbox.isSandboxed(world->token(world->start({std::nullopt, {}, true}))));
}

TEST_P(ProcessContract, AProcessReadsWhatIsNotHiddenFromIt)
{
    const auto open = world->token(world->start({std::nullopt, {}, true, true}));
    const auto closed = world->token(world->start({std::nullopt, {}, true, false}));
    for (const auto& path : {font, fontFiles}) {
        EXPECT_TRUE(sandbox.mayRead(open, path)) << path;
    }
    EXPECT_FALSE(sandbox.mayRead(closed, font));
    EXPECT_FALSE(sandbox.mayRead(open, fontFiles + "/missing.ttf"));
}

TEST_P(ProcessContract, ExtensionsAreIssuedEachOneAnew)
{
    const auto token = world->token(world->start({std::nullopt, {}, true, false}));
    const auto one = sandbox.issueReadExtension(token, font);
    const auto other = sandbox.issueReadExtension(token, font);
    ASSERT_TRUE(one && other);
    EXPECT_NE(*one, *other);
    EXPECT_TRUE(sandbox.issueReadExtension(token, fontFiles));
    EXPECT_EQ(one->find('\0'), std::string::npos);
}

TEST_P(ProcessContract, AProcessThatIsGoneIsNobodyAndGetsNothing)
{
    const auto process = world->start({"org.example.viewer", {}, false});
    const auto token = world->token(process);
    ASSERT_TRUE(codeSigning.taskFromAuditToken(token));
    world->end(process);
    for (const auto& gone : {token, AuditToken{}}) {
        EXPECT_FALSE(codeSigning.taskFromAuditToken(gone));
        EXPECT_TRUE(sandbox.isSandboxed(gone));
        EXPECT_FALSE(sandbox.mayRead(gone, font));
        EXPECT_EQ(sandbox.issueReadExtension(gone, font), std::nullopt);
    }
}

TEST_P(ProcessContract, AnExecMakesTheTokenNameNobody)
{
    const auto [before, after] = world->becomeAnother({}, {"org.example.viewer", {}});
    EXPECT_FALSE(codeSigning.taskFromAuditToken(before));
    EXPECT_TRUE(sandbox.isSandboxed(before));
    EXPECT_EQ(sandbox.issueReadExtension(before, font), std::nullopt);
    const auto task = codeSigning.taskFromAuditToken(after);
    ASSERT_TRUE(task);
    EXPECT_EQ(task->signingIdentifier, "org.example.viewer");
    EXPECT_FALSE(sandbox.isSandboxed(after));
}

}  // namespace
}  // namespace typhon
