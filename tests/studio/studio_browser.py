"""A studio of its own and a browser without a window, for tests and for the pictures of the pages."""
import json
import pathlib
import shutil
import subprocess
import time

SKIPPED = 77


def why_not():
    """Why there can be no browser here; empty where there can."""
    try:
        import selenium  # noqa: F401
    except ImportError:
        return "python3-selenium is not installed"
    for program in ("chromium", "chromedriver"):
        if not shutil.which(program):
            return f"{program} is not installed"
    return ""


def until(what, condition, seconds=60):
    end = time.monotonic() + seconds
    while True:
        found = condition()
        if found:
            return found
        if time.monotonic() > end:
            raise TimeoutError(what)
        time.sleep(0.03)


class Studio:
    """`calmframe studio` over a folder, with a session in another; may be killed and started again."""

    def __init__(self, program, folder, session, port=0, words=()):
        self.words = [program, "studio", "--no-browser", "--root", folder, "--session", session, *words]
        self.port = port
        self.process = None

    def start(self, *clips):
        self.process = subprocess.Popen([*map(str, self.words), "--port", str(self.port), *map(str, clips)],
                                        stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)
        self.address = self.process.stdout.readline().strip()
        if not self.address:
            raise RuntimeError(self.process.stderr.read())
        self.port = int(self.address.split(":")[2].split("/")[0])
        return self.address

    def kill(self):
        self.process.kill()
        self.process.wait()

    def stop(self):
        self.process.terminate()
        return self.process.wait(20)


class Page:
    """A window of the browser."""

    def __init__(self, width=1440, height=900, dark=True):
        from selenium import webdriver
        from selenium.webdriver.chrome.options import Options
        from selenium.webdriver.chrome.service import Service

        options = Options()
        for word in ("--headless=new", "--no-sandbox", "--disable-gpu", "--disable-dev-shm-usage", "--hide-scrollbars",
                     f"--window-size={width},{height}", "--force-device-scale-factor=1"):
            options.add_argument(word)
        if dark:
            options.add_argument("--blink-settings=preferredColorScheme=0")
        options.set_capability("goog:loggingPrefs", {"browser": "ALL"})
        self.driver = webdriver.Chrome(service=Service("/usr/bin/chromedriver"), options=options)
        self.driver.set_script_timeout(60)

    def close(self):
        self.driver.quit()

    def open(self, address):
        self.driver.get(address)

    def size(self, width, height):
        self.driver.execute_cdp_cmd("Emulation.setDeviceMetricsOverride",
                                    {"width": width, "height": height, "deviceScaleFactor": 1, "mobile": False})

    def run(self, script, *arguments):
        return self.driver.execute_script(script, *arguments)

    def find(self, selector):
        from selenium.webdriver.common.by import By
        return self.driver.find_elements(By.CSS_SELECTOR, selector)

    def see(self, selector, text="", seconds=60):
        """The first element that is shown and has the text."""
        def found():
            return self.run("""return [...document.querySelectorAll(arguments[0])].find(
                (e) => e.offsetParent !== null && e.textContent.includes(arguments[1])) || null""", selector, text)
        return until(f"{selector} {text}", found, seconds)

    def click(self, selector, text=""):
        until(f"{selector} {text} to be enabled", lambda: not self.see(selector, text).get_attribute("disabled"))
        self.see(selector, text).click()

    def keys(self, *keys, held=None):
        from selenium.webdriver.common.action_chains import ActionChains
        chain = ActionChains(self.driver)
        if held:
            chain.key_down(held)
        chain.send_keys(*keys)
        if held:
            chain.key_up(held)
        chain.perform()

    def clip(self):
        """The selected clip's state, as the studio tells it to any window."""
        script = """const [done] = [arguments[arguments.length - 1]];
            const source = new EventSource('/api/events');
            source.onmessage = (event) => { source.close(); done(event.data); };"""
        state = json.loads(self.driver.execute_async_script(script))
        self.state = state
        selected = self.run("return location.hash.slice(1)")
        return state["clips"].get(selected, {})

    def ask(self, request):
        return self.driver.execute_async_script(
            """const done = arguments[arguments.length - 1];
            fetch('/api/do', {method: 'POST', headers: {'Content-Type': 'application/json'}, body: JSON.stringify(arguments[0])})
              .then((r) => r.json()).then(done, (error) => done({error: String(error)}));""", request)

    def shown(self):
        """The address of the picture that the canvas shows."""
        return self.run("return document.querySelector('canvas')?.dataset.shown || ''")

    def pixels(self):
        """The canvas, 64 by 36, as a list of bytes."""
        return self.run("""const from = document.querySelector('canvas'), to = document.createElement('canvas');
            to.width = 64; to.height = 36; const context = to.getContext('2d');
            context.drawImage(from, 0, 0, 64, 36); return [...context.getImageData(0, 0, 64, 36).data]""")

    def errors(self):
        return [entry["message"] for entry in self.driver.get_log("browser") if entry["level"] == "SEVERE"]

    def save(self, path):
        pathlib.Path(path).parent.mkdir(parents=True, exist_ok=True)
        self.driver.save_screenshot(str(path))
