"""The browser, and the page as a person finds things in it: by their words."""
from selenium import webdriver
from selenium.common.exceptions import NoSuchElementException, StaleElementReferenceException
from selenium.webdriver.chrome.service import Service
from selenium.webdriver.common.by import By
from selenium.webdriver.support.ui import Select

import machine

ADDRESS = "http://127.0.0.1:{port}/cockpit/@localhost/tavischeduler/index.html"
DOWNLOADS = "/tmp/downloads"


class Page:
    def __init__(self):
        options = webdriver.ChromeOptions()
        for argument in ("--headless=new", "--no-sandbox", "--disable-gpu", "--disable-dev-shm-usage", "--lang=en-GB",
                         "--force-color-profile=srgb", "--hide-scrollbars"):
            options.add_argument(argument)
        options.add_experimental_option("prefs", {"download.default_directory": DOWNLOADS})
        options.set_capability("goog:loggingPrefs", {"browser": "ALL"})
        self.pages = 0
        self.driver = webdriver.Chrome(options=options, service=Service("/usr/bin/chromedriver"))
        self.size(1280, 900)

    def size(self, width, height, scale=1):
        self.driver.execute_cdp_cmd("Emulation.setDeviceMetricsOverride", {
            "width": width, "height": height, "deviceScaleFactor": scale, "mobile": width < 600})

    def open(self, path, wait_for, port=machine.PORT):
        """Opens a view of a new page and waits until it shows a text."""
        self.pages += 1  # another address, as another view of the same one would be no new page
        self.driver.get(f"{ADDRESS.format(port=port)}?{self.pages}#/{path}")
        self.until_text(wait_for)

    def style(self, name):
        self.driver.execute_script("localStorage.setItem('shell:style', arguments[0]);"
                                   "dispatchEvent(new Event('cockpit-style'))", name)

    def find(self, selector):
        """Waits for it, as a view is drawn a moment after the click that leads there."""
        return machine.until(lambda: self.all(selector), f"there is {selector}")[0]

    def all(self, selector):
        return self.driver.find_elements(By.CSS_SELECTOR, selector)

    def text(self, selector="body"):
        try:
            return self.driver.find_element(By.CSS_SELECTOR, selector).text
        except (NoSuchElementException, StaleElementReferenceException):
            return ""

    def until_text(self, text, selector="body", seconds=10):
        machine.until(lambda: text in self.text(selector), f"{selector} says {text!r}", seconds)

    def row(self, text):
        """The row of a table that begins so."""
        rows = [row for row in self.all("tbody tr") if row.text.startswith(text)]
        assert len(rows) == 1, f"{len(rows)} rows begin with {text!r}"
        return rows[0]

    def buttons(self, name, within=None):
        """The buttons and switches of a name."""
        return (within or self.driver).find_elements(
            By.XPATH, f".//*[self::button or @role='switch'][normalize-space()=\"{name}\" or @aria-label=\"{name}\"]")

    def button(self, name, within=None):
        return machine.until(lambda: self.buttons(name, within), f"there is {name!r}")[0]

    def press(self, name, within=None):
        self.button(name, within).click()

    def answer(self, name):
        """Presses a button of the question and waits for its end."""
        self.press(name, machine.until(lambda: self.all("dialog[open]"), "there is a question")[0])
        machine.until(lambda: not self.all("dialog"), "the question is over")

    def field(self, title):
        labels = By.XPATH, f"//label[normalize-space(text())='{title}']"
        label = machine.until(lambda: self.driver.find_elements(*labels), f"there is {title!r}")[0]
        control = label.get_attribute("for")
        return self.find(f"#{control}") if control else label.find_element(By.CSS_SELECTOR, "input, select")

    def enter(self, title, value):
        field = self.field(title)
        if field.tag_name == "select":
            Select(field).select_by_visible_text(value)
        elif field.get_attribute("type") in ("time", "date"):  # typed in the browser's own language otherwise
            self.driver.execute_script("arguments[0].value = arguments[1]; arguments[0].dispatchEvent(new Event('input'))",
                                       field, value)
        elif field.get_attribute("type") == "file":
            field.send_keys(value)
        else:
            self.driver.execute_script("arguments[0].select()", field)
            field.send_keys(value)

    def error_of(self, title):
        """The error that a screen reader tells with a field."""
        described = self.field(title).get_attribute("aria-describedby") or ""
        return " ".join(self.text(f"#{each}") for each in described.split() if each.endswith("-error"))

    def complaints(self):
        """What the browser says about the page: errors, and what the content security policy forbade."""
        return [entry["message"] for entry in self.driver.get_log("browser") if entry["level"] == "SEVERE"]
